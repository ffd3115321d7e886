#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "host/phone/phone_state.h"

namespace appsync::host {

/// One package on its way from a file of the desktop to a file of the phone, a chunk at a time, so
/// that another can be sent in between. Used by one thread.
class PackageTransfer {
 public:
  static constexpr std::size_t ChunkSize = 256 << 10;

  enum class Step { More, Done, Failed };

  /// Touches nothing before the first step.
  PackageTransfer(std::filesystem::path source, std::string target, Durability durability)
      : source_(std::move(source)), target_(std::move(target)), durability_(durability) {}

  /// Sends the next chunk. After Failed (with an error) nothing of the package stays on the phone.
  [[nodiscard]] Step sendChunk(const Phone& phone, std::optional<Error>* error);

  std::uint64_t sent() const { return sent_; }
  std::uint64_t total() const { return total_; }  ///< 0 before the first step
  /// True when the share sent has grown by at least a hundredth since this was last true.
  bool progressed();

 private:
  [[nodiscard]] bool open(const Phone& phone, std::optional<Error>* error);
  bool fail(int errnoValue, std::optional<Error>* error) const;

  const std::filesystem::path source_;
  const std::string target_;
  const Durability durability_;
  FileDescriptor file_;
  std::unique_ptr<FileReceiver> receiver_;
  Bytes chunk_;
  std::uint64_t sent_ = 0;
  std::uint64_t total_ = 0;
  std::uint64_t reported_ = 0;  // hundredths
};

}  // namespace appsync::host
