#include "base/temporary_file.h"

#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>

namespace appsync {

namespace {

constexpr std::string_view Prefix = ".appsync-";
constexpr std::size_t Digits = 16;

}  // namespace

std::string makeTemporaryName() {
  std::uint64_t value = 0;
  while (::getrandom(&value, sizeof value, 0) != sizeof value) {
  }
  std::array<char, Digits + 1> digits{};
  std::snprintf(digits.data(), digits.size(), "%016llx", static_cast<unsigned long long>(value));
  return std::string(Prefix) + digits.data();
}

bool isTemporaryName(std::string_view name) noexcept {
  return name.size() == Prefix.size() + Digits && name.starts_with(Prefix) &&
         name.find_first_not_of("0123456789abcdef", Prefix.size()) == std::string_view::npos;
}

TemporaryFile::TemporaryFile(int directory) noexcept
    : directory_(directory),
      name_(makeTemporaryName()),
      file_(::openat(directory, name_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                     0644)) {}

TemporaryFile::~TemporaryFile() {
  if (name_.empty() || !file_) return;
  const int saved = errno;
  ::unlinkat(directory_, name_.c_str(), 0);
  errno = saved;
}

bool TemporaryFile::takePlaceOf(const std::string& name, Durability durability) noexcept {
  const bool durable = durability == Durability::Durable;
  if (durable && !syncToDisk(file_.get())) return false;
  if (::renameat(directory_, name_.c_str(), directory_, name.c_str()) != 0) return false;
  name_.clear();
  return !durable || syncToDisk(directory_);
}

}  // namespace appsync
