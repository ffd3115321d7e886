#include "host/report/output.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <string>

namespace appsync::host {

void Output::write(std::string_view text) {
  const Lock lock(mutex_);
  while (!text.empty() && error_ == 0) {
    const ssize_t written = ::write(fd_, text.data(), text.size());
    if (written >= 0) {
      text.remove_prefix(static_cast<std::size_t>(written));
    } else if (errno == EAGAIN) {
      // Whoever shares this end may have made it non-blocking.
      pollfd ready{fd_, POLLOUT, 0};
      ::poll(&ready, 1, -1);
    } else if (errno != EINTR) {
      error_ = errno;
    }
  }
}

void Output::line(std::string_view text) {
  std::string whole(text);
  write(whole += '\n');
}

int Output::error() const {
  const Lock lock(mutex_);
  return error_;
}

bool Output::isTerminal() const { return ::isatty(fd_) == 1; }

std::size_t Output::width() const {
  winsize size{};
  if (::ioctl(fd_, TIOCGWINSZ, &size) != 0 || size.ws_col == 0) return 80;
  return size.ws_col;
}

bool openStandardDescriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (::fcntl(fd, F_GETFD) >= 0) continue;
    // The lowest that is free is taken, which is this one.
    if (::open("/dev/null", O_RDWR) != fd) return false;
  }
  return true;
}

}  // namespace appsync::host
