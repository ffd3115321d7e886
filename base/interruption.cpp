#include "base/interruption.h"

#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <string_view>
#include <utility>

namespace appsync {
namespace {

constexpr char SignalMark = 's';
constexpr char EndMark = 'e';

// What a signal handler may touch.
std::atomic<int> signalPipe{-1};
std::atomic<int> signalCount{0};
std::atomic<bool> cursorHidden{false};
static_assert(std::atomic<int>::is_always_lock_free && std::atomic<bool>::is_always_lock_free);

void writeMark(int fd, char mark) {
  while (::write(fd, &mark, 1) < 0 && errno == EINTR) {
  }
}

extern "C" void handleSignal(int number) {
  const int savedErrno = errno;
  if (signalCount.fetch_add(1) > 0) {
    if (number == SIGHUP) return;
    constexpr std::string_view ShowCursor = "\x1b[?25h\n";
    if (cursorHidden && ::write(STDOUT_FILENO, ShowCursor.data(), ShowCursor.size()) < 0) {
      // Nothing is left to be done about it.
    }
    ::_exit(130);
  }
  writeMark(signalPipe, SignalMark);
  errno = savedErrno;
}

constexpr std::array Signals = {SIGINT, SIGTERM, SIGHUP};
std::array<struct sigaction, Signals.size()> previous;
int readEnd = -1;

}  // namespace

void setCursorHidden(bool hidden) noexcept { cursorHidden = hidden; }

void Interruption::request() {
  const Lock lock(mutex_);
  if (requested_.exchange(true)) return;
  if (listener_) listener_();
}

void Interruption::setListener(std::function<void()> listener) {
  const Lock lock(mutex_);
  listener_ = std::move(listener);
  if (requested_ && listener_) listener_();
}

SignalWatcher::SignalWatcher(Interruption& interruption) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return;
  readEnd = ends[0];
  signalPipe = ends[1];
  signalCount = 0;
  thread_ = std::thread([&interruption] {
    char mark = 0;
    while (true) {
      const ssize_t count = ::read(readEnd, &mark, 1);
      if (count < 0 && errno == EINTR) continue;
      if (count != 1 || mark == EndMark) return;
      interruption.request();
    }
  });
  struct sigaction action {};
  action.sa_handler = &handleSignal;
  action.sa_flags = SA_RESTART;
  ::sigemptyset(&action.sa_mask);
  for (std::size_t i = 0; i < Signals.size(); ++i) {
    ::sigaction(Signals[i], nullptr, &previous[i]);
    const bool ignored = previous[i].sa_handler == SIG_IGN;
    if (Signals[i] != SIGHUP || !ignored) ::sigaction(Signals[i], &action, nullptr);
  }
}

SignalWatcher::~SignalWatcher() {
  if (!thread_.joinable()) return;
  for (std::size_t i = 0; i < Signals.size(); ++i) ::sigaction(Signals[i], &previous[i], nullptr);
  writeMark(signalPipe, EndMark);
  thread_.join();
  ::close(signalPipe.exchange(-1));
  ::close(std::exchange(readEnd, -1));
}

}  // namespace appsync
