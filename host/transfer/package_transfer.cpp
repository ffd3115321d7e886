#include "host/transfer/package_transfer.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

namespace appsync::host {

bool PackageTransfer::fail(int errnoValue, std::optional<Error>* error) const {
  return failWith(error, Error::posix(errnoValue, source_.string()));
}

bool PackageTransfer::open(const Phone& phone, std::optional<Error>* error) {
  // Without O_NONBLOCK a pipe put in the package's place would hold the sync up.
  file_.reset(::open(source_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  struct stat status {};
  if (!file_ || ::fstat(file_.get(), &status) != 0) return fail(errno, error);
  if (!S_ISREG(status.st_mode)) return fail(ENOEXEC, error);
  total_ = static_cast<std::uint64_t>(status.st_size);
  receiver_ = phone.incoming.receiveFile(target_, error);
  return receiver_ != nullptr;
}

PackageTransfer::Step PackageTransfer::sendChunk(const Phone& phone, std::optional<Error>* error) {
  if (!receiver_ && !open(phone, error)) return Step::Failed;
  chunk_.resize(ChunkSize);
  const std::int64_t count = readSome(file_.get(), chunk_);
  bool ok = count >= 0 || fail(errno, error);
  if (ok && count > 0) {
    const auto size = static_cast<std::size_t>(count);
    ok = receiver_->append(ByteView(chunk_).first(size), error);
    sent_ += size;
  }
  if (ok && sent_ < total_ && count > 0) return Step::More;
  if (ok && sent_ != total_) {
    ok = failWith(error,
                  Error::withDescription(POSIXErrorDomain, ESTALE,
                                         source_.string() + " changed while it was being sent"));
  }
  ok = ok && receiver_->finish(durability_, error);
  receiver_.reset();
  return ok ? Step::Done : Step::Failed;
}

bool PackageTransfer::progressed() {
  const std::uint64_t hundredths = total_ == 0 ? 100 : sent_ * 100 / total_;
  if (hundredths <= reported_) return false;
  reported_ = hundredths;
  return true;
}

}  // namespace appsync::host
