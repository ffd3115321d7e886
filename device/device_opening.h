#pragma once

#include <string>

// What making or opening a device takes, and why it may not be.

namespace appsync::device {

/// Why a device folder cannot be used.
enum class DeviceProblem {
  Missing,   ///< there is no device at the path
  Exists,    ///< a new device was asked for where something stands already
  Busy,      ///< another process is writing the device
  Foreign,   ///< the folder holds something else, or a device of a newer version
  Damaged,   ///< a device, but its data cannot be read
  Unusable,  ///< the system refuses (permissions, disk full, ...)
};

struct DeviceError {
  DeviceProblem problem = DeviceProblem::Missing;
  /// One line for people that names the folder, the reason and what to do.
  std::string message;
};

enum class Access {
  Write,    ///< takes the device's lock for as long as the object lives
  ReadOnly  ///< may look at any time, also while another process writes
};

struct DeviceOptions {
  bool coordination = false;  ///< whether installs are driven through install coordinators
};

}  // namespace appsync::device
