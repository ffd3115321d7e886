#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>

#include "base/file_descriptor.h"
#include "device/device_folder.h"
#include "platform/error.h"

namespace appsync::device {

/// What a person does on the home screen to the placeholder of an application.
enum class PersonWish { Tap, Cancel };

/// Carries a wish out; gives the reason when it cannot be. The identifier is a usable one.
using PersonAction = std::function<std::optional<Error>(PersonWish, std::string_view bundleId)>;

/// Takes the wishes of other processes while this one writes the device: "person" in the device's
/// folder, for its owner only. One line asks ("tap ID", "cancel ID"), one answers ("ok",
/// "error TEXT"); one asker at a time, and one that dawdles is sent away.
class PersonSocket {
 public:
  /// To be called by the holder of the device's lock; what a killed one left is replaced. nullptr
  /// with errno set when there can be no socket. `action` runs on a thread of the socket's own.
  static std::unique_ptr<PersonSocket> open(const DevicePaths& paths, PersonAction action);
  ~PersonSocket();
  PersonSocket(const PersonSocket&) = delete;
  PersonSocket& operator=(const PersonSocket&) = delete;

 private:
  PersonSocket(FileDescriptor folder, FileDescriptor listener, FileDescriptor end,
               PersonAction action);
  void serve();

  const FileDescriptor folder_;
  const FileDescriptor listener_;
  const FileDescriptor end_;  ///< readable when the socket is to be closed
  const PersonAction action_;
  std::thread thread_;
};

enum class WishOutcome {
  NobodyThere,  ///< no process has the socket open
  Done,
  Refused,  ///< the error tells why
  Failed    ///< the socket cannot be used; the error tells why
};

/// Asks the process that writes the device. Waits some seconds at most.
[[nodiscard]] WishOutcome askWriter(const DevicePaths& paths, PersonWish wish,
                                    std::string_view bundleId, std::optional<Error>* error);

}  // namespace appsync::device
