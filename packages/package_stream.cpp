#include "packages/package_stream.h"

#include <archive.h>
#include <unistd.h>
#include <zlib.h>

#include <array>
#include <cerrno>
#include <vector>

#include "base/file_descriptor.h"
#include "packages/package_entry_rules.h"

namespace appsync {

namespace {

constexpr std::size_t BlockSize = std::size_t{128} << 10;

std::optional<Error> damaged(std::string_view detail) {
  return refusalError(PackageRefusal::Damaged, detail);
}

/// The archive library reads gzip without looking at its checksums, so zlib does it here.
class GzipStream final : public PackageStream {
 public:
  explicit GzipStream(int fd) : fd_(fd), input_(BlockSize), output_(2 * BlockSize) {
    constexpr int gzipOnly = 16;
    usable_ = ::inflateInit2(&state_, MAX_WBITS + gzipOnly) == Z_OK;
  }
  ~GzipStream() override { ::inflateEnd(&state_); }
  GzipStream(const GzipStream&) = delete;
  GzipStream& operator=(const GzipStream&) = delete;

  std::optional<Error> next(ByteView& bytes) override {
    bytes = {};
    if (!usable_) return Error::posix(ENOMEM);
    state_.next_out = output_.data();
    state_.avail_out = static_cast<uInt>(output_.size());
    while (state_.avail_out == output_.size()) {
      if (auto error = fill()) return error;
      if (state_.avail_in == 0)
        return between_ ? std::nullopt : damaged("the compressed data is cut off");
      // Files that were compressed one after another are one.
      if (between_ && ::inflateReset(&state_) != Z_OK) return damaged("zlib");
      between_ = false;
      const int result = ::inflate(&state_, Z_NO_FLUSH);
      between_ = result == Z_STREAM_END;
      if (result != Z_OK && !between_)
        return damaged(state_.msg ? state_.msg : "the compressed data is wrong");
    }
    bytes = std::as_bytes(std::span(output_)).first(output_.size() - state_.avail_out);
    return std::nullopt;
  }

 private:
  std::optional<Error> fill() {
    if (state_.avail_in != 0) return std::nullopt;
    const std::int64_t count = readSome(fd_, std::as_writable_bytes(std::span(input_)));
    if (count < 0) return Error::posix(errno);
    state_.next_in = input_.data();
    state_.avail_in = static_cast<uInt>(count);
    return std::nullopt;
  }

  const int fd_;
  std::vector<Bytef> input_;
  std::vector<Bytef> output_;
  z_stream state_{};
  bool usable_ = false;
  bool between_ = false;  ///< one compressed member has ended well
};

class FilterStream final : public PackageStream {
 public:
  explicit FilterStream(int fd) : archive_(::archive_read_new()) {
    // Named one by one: "all" includes filters that run other programs on what they are given.
    for (const auto support :
         {::archive_read_support_filter_bzip2, ::archive_read_support_filter_compress,
          ::archive_read_support_filter_lzma, ::archive_read_support_filter_xz,
          ::archive_read_support_filter_lzip, ::archive_read_support_filter_lz4,
          ::archive_read_support_filter_zstd, ::archive_read_support_format_raw})
      support(archive_.get());
    archive_entry* entry = nullptr;
    status_ = ::archive_read_open_fd(archive_.get(), fd, BlockSize);
    if (status_ == ARCHIVE_OK) status_ = ::archive_read_next_header(archive_.get(), &entry);
  }

  std::optional<Error> next(ByteView& bytes) override {
    bytes = {};
    const void* block = nullptr;
    std::size_t size = 0;
    la_int64_t offset = 0;
    // A compressed block may be empty without being the last.
    while (status_ == ARCHIVE_OK && size == 0)
      status_ = ::archive_read_data_block(archive_.get(), &block, &size, &offset);
    if (status_ == ARCHIVE_EOF) return std::nullopt;
    if (status_ != ARCHIVE_OK) {
      const char* text = ::archive_error_string(archive_.get());
      return damaged(text ? text : "the compressed data is wrong");
    }
    bytes = {static_cast<const std::byte*>(block), size};
    return std::nullopt;
  }

 private:
  struct Free {
    void operator()(archive* a) const { ::archive_read_free(a); }
  };
  std::unique_ptr<archive, Free> archive_;
  int status_ = ARCHIVE_OK;
};

}  // namespace

std::unique_ptr<PackageStream> openPackageStream(int packageFd) {
  std::array<unsigned char, 2> magic{};
  const bool known = ::pread(packageFd, magic.data(), magic.size(), 0) == 2;
  ::lseek(packageFd, 0, SEEK_SET);
  if (known && magic[0] == 0x1f && magic[1] == 0x8b) return std::make_unique<GzipStream>(packageFd);
  return std::make_unique<FilterStream>(packageFd);
}

}  // namespace appsync
