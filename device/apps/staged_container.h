#pragma once

#include <optional>
#include <string>

#include "device/state/device_core.h"

namespace appsync::device {

/// A container that disappears with the object unless it is kept, or a commit that failed may still
/// name it: then the sweep at the next opening knows better.
class StagedContainer {
 public:
  StagedContainer(DeviceCore& core, std::optional<Error>* error)
      : core_(core), path_(core.containers.make(error)) {}
  ~StagedContainer() {
    if (path_ && core_.database.settle()) core_.containers.remove(*path_);
  }
  StagedContainer(const StagedContainer&) = delete;
  StagedContainer& operator=(const StagedContainer&) = delete;

  bool isMade() const { return path_.has_value(); }
  const std::string& path() const { return *path_; }
  void keep() { path_.reset(); }

 private:
  DeviceCore& core_;
  std::optional<std::string> path_;
};

}  // namespace appsync::device
