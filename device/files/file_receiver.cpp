#include "device/files/file_receiver.h"

#include <sys/stat.h>

#include <cerrno>

#include "base/temporary_file.h"
#include "device/files/file_manager.h"

namespace appsync::device {

namespace {

class ReceivedFile final : public FileReceiver {
 public:
  ReceivedFile(FileDescriptor directory, std::string path)
      : directory_(std::move(directory)), path_(std::move(path)), file_(directory_.get()) {}

  bool isOpen() const { return file_.isOpen(); }

  bool append(ByteView bytes, std::optional<Error>* error) noexcept override {
    if (broken_ == 0 && !writeAll(file_.fd(), bytes)) broken_ = errno;
    return report(error);
  }

  bool finish(Durability durability, std::optional<Error>* error) noexcept override {
    const std::string name = path_.substr(path_.rfind('/') + 1);
    if (broken_ == 0 && !file_.takePlaceOf(name, durability)) broken_ = errno;
    if (!report(error)) return false;
    broken_ = EBADF;  // whatever comes after the end
    return true;
  }

 private:
  bool report(std::optional<Error>* error) const {
    if (broken_ != 0) setError(error, Error::posix(broken_, path_));
    return broken_ == 0;
  }

  FileDescriptor directory_;
  const std::string path_;
  TemporaryFile file_;
  int broken_ = 0;  ///< errno of the first failure: a file with a gap must never be finished
};

}  // namespace

std::unique_ptr<FileReceiver> receiveInto(ConfinedFileManager& files, std::string_view path,
                                          std::optional<Error>* error) noexcept {
  const auto fail = [&](int reason) -> std::unique_ptr<FileReceiver> {
    setError(error, Error::posix(reason, path));
    return nullptr;
  };
  const std::size_t slash = path.rfind('/');
  const std::string_view name = path.substr(slash == std::string_view::npos ? 0 : slash + 1);
  if (slash == std::string_view::npos || name.empty() || name == "." || name == ".." ||
      path.find('\0') != std::string_view::npos)
    return fail(EINVAL);
  if (files.directoryExists(path)) return fail(EISDIR);

  const std::string_view parent = slash == 0 ? path.substr(0, 1) : path.substr(0, slash);
  if (!files.createDirectory(parent, true, {}, error)) return nullptr;
  FileDescriptor directory = files.openDirectory(parent, error);
  if (!directory) return nullptr;
  auto receiver = std::make_unique<ReceivedFile>(std::move(directory), std::string(path));
  if (!receiver->isOpen()) return fail(errno);
  return receiver;
}

}  // namespace appsync::device
