#include "device/person_socket.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <string>
#include <system_error>

#include "base/identifiers.h"
#include "base/text.h"

namespace appsync::device {
namespace {

using Clock = std::chrono::steady_clock;

constexpr const char* Name = "person";
constexpr std::size_t LongestRequest = 256;
constexpr std::size_t LongestAnswer = 1024;
constexpr std::chrono::seconds RequestTime{2};
constexpr std::chrono::seconds AnswerTime{10};
constexpr std::string_view ErrorWord = "error ";

FileDescriptor openFolderOf(const DevicePaths& paths) {
  return FileDescriptor(::open(paths.folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

/// The socket's address by way of the open folder: a path of any length would not fit.
sockaddr_un addressIn(const FileDescriptor& folder) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string path = fmt::format("/proc/self/fd/{}/{}", folder.get(), Name);
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

FileDescriptor newSocket(int flags = 0) {
  return FileDescriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | flags, 0));
}

bool removeStale(const FileDescriptor& folder) {
  struct stat status {};
  if (fstatat(folder.get(), Name, &status, AT_SYMLINK_NOFOLLOW) != 0) return errno == ENOENT;
  if (S_ISSOCK(status.st_mode)) return unlinkat(folder.get(), Name, 0) == 0;
  errno = EEXIST;
  return false;
}

bool listenAt(const FileDescriptor& listener, const FileDescriptor& folder) {
  const sockaddr_un address = addressIn(folder);
  // The mode is set before the name appears, so that there is no moment in which others may enter.
  return listener && fchmod(listener.get(), S_IRUSR | S_IWUSR) == 0 && removeStale(folder) &&
         bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
         listen(listener.get(), 8) == 0;
}

/// Whether `fd` can be read before `deadline` (none: wait for ever) and before `end` says stop.
bool waitToRead(int fd, int end, std::optional<Clock::time_point> deadline) {
  pollfd both[] = {{fd, POLLIN, 0}, {end, POLLIN, 0}};
  for (;;) {
    int patience = -1;
    if (deadline) {
      const auto left =
          std::chrono::duration_cast<std::chrono::milliseconds>(*deadline - Clock::now());
      if (left.count() <= 0) return false;
      patience = static_cast<int>(left.count());
    }
    const int ready = poll(both, 2, patience);
    if (ready < 0 && errno == EINTR) continue;
    return ready > 0 && both[1].revents == 0;
  }
}

bool isSameUser(int connection) {
  ucred peer{};
  socklen_t size = sizeof peer;
  return getsockopt(connection, SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0 &&
         peer.uid == geteuid();
}

/// The first line without its end; none when it is too long, does not come in time or is cut off.
std::optional<std::string> readRequest(int connection, int end) {
  const auto deadline = Clock::now() + RequestTime;
  std::string line;
  while (line.size() < LongestRequest && waitToRead(connection, end, deadline)) {
    char piece[LongestRequest];
    const ssize_t count = recv(connection, piece, LongestRequest - line.size(), MSG_DONTWAIT);
    if (count < 0 && (errno == EINTR || errno == EAGAIN)) continue;
    if (count <= 0) break;
    line.append(piece, static_cast<std::size_t>(count));
    const std::size_t newline = line.find('\n');
    if (newline != std::string::npos) return line.substr(0, newline);
  }
  return std::nullopt;
}

std::string_view wordFor(PersonWish wish) { return wish == PersonWish::Tap ? "tap" : "cancel"; }

std::string answerTo(const std::optional<std::string>& request, const PersonAction& action) {
  if (!request) return "error the request is no line, is too long or took too long";
  const std::size_t space = request->find(' ');
  if (space == std::string::npos) return "error the request names no application";
  const std::string_view word = std::string_view(*request).substr(0, space);
  const std::string_view bundleId = std::string_view(*request).substr(space + 1);
  for (const PersonWish wish : {PersonWish::Tap, PersonWish::Cancel}) {
    if (word != wordFor(wish)) continue;
    if (!isUsableIdentifier(bundleId)) return "error no application can have this identifier";
    const std::optional<Error> refusal = action(wish, bundleId);
    return refusal ? std::string(ErrorWord) +
                         oneLine(refusal->localizedDescription()).substr(0, LongestAnswer / 2)
                   : "ok";
  }
  return "error the request is neither to tap nor to cancel";
}

/// Both lines are far shorter than a socket's buffer, so they go in one piece.
bool sendLine(int connection, std::string line) {
  line += '\n';
  return send(connection, line.data(), line.size(), MSG_NOSIGNAL) ==
         static_cast<ssize_t>(line.size());
}

std::string readAnswer(int connection) {
  std::string text;
  while (text.size() < LongestAnswer && text.find('\n') == std::string::npos) {
    char piece[LongestAnswer];
    const ssize_t count = recv(connection, piece, LongestAnswer - text.size(), 0);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) break;
    text.append(piece, static_cast<std::size_t>(count));
  }
  return text.substr(0, text.find('\n'));
}

FileDescriptor connectTo(const DevicePaths& paths) {
  FileDescriptor connection = newSocket();
  const FileDescriptor folder = openFolderOf(paths);
  if (!connection || !folder) return {};
  const timeval patience{AnswerTime.count(), 0};
  for (const int which : {SO_RCVTIMEO, SO_SNDTIMEO}) {
    setsockopt(connection.get(), SOL_SOCKET, which, &patience, sizeof patience);
  }
  const sockaddr_un address = addressIn(folder);
  if (connect(connection.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    connection.reset();
  }
  return connection;
}

}  // namespace

std::unique_ptr<PersonSocket> PersonSocket::open(const DevicePaths& paths, PersonAction action) {
  FileDescriptor folder = openFolderOf(paths);
  FileDescriptor listener = newSocket(SOCK_NONBLOCK);
  FileDescriptor end(eventfd(0, EFD_CLOEXEC));
  if (!folder || !end || !listenAt(listener, folder)) return nullptr;
  try {
    return std::unique_ptr<PersonSocket>(new PersonSocket(std::move(folder), std::move(listener),
                                                          std::move(end), std::move(action)));
  } catch (const std::system_error&) {  // no thread to be had; a stale socket answers nobody
    errno = EAGAIN;
    return nullptr;
  }
}

PersonSocket::PersonSocket(FileDescriptor folder, FileDescriptor listener, FileDescriptor end,
                           PersonAction action)
    : folder_(std::move(folder)),
      listener_(std::move(listener)),
      end_(std::move(end)),
      action_(std::move(action)),
      thread_([this] { serve(); }) {}

PersonSocket::~PersonSocket() {
  unlinkat(folder_.get(), Name, 0);
  eventfd_write(end_.get(), 1);
  thread_.join();
}

void PersonSocket::serve() {
  while (waitToRead(listener_.get(), end_.get(), std::nullopt)) {
    const FileDescriptor connection(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!connection || !isSameUser(connection.get())) continue;
    sendLine(connection.get(), answerTo(readRequest(connection.get(), end_.get()), action_));
  }
}

WishOutcome askWriter(const DevicePaths& paths, PersonWish wish, std::string_view bundleId,
                      std::optional<Error>* error) {
  const FileDescriptor connection = connectTo(paths);
  if (!connection) {
    if (errno == ENOENT || errno == ECONNREFUSED) return WishOutcome::NobodyThere;
    setError(error, Error::posix(errno));
    return WishOutcome::Failed;
  }
  std::string answer;
  if (sendLine(connection.get(), fmt::format("{} {}", wordFor(wish), bundleId))) {
    answer = readAnswer(connection.get());
  }
  if (answer == "ok") return WishOutcome::Done;
  if (answer.starts_with(ErrorWord)) {
    setError(error,
             Error::withDescription(POSIXErrorDomain, ECANCELED, answer.substr(ErrorWord.size())));
    return WishOutcome::Refused;
  }
  setError(error, Error::withDescription(POSIXErrorDomain, EPROTO,
                                         "the process that writes the phone does not answer"));
  return WishOutcome::Failed;
}

}  // namespace appsync::device
