#include "tests/fakes/other_process.h"

#include <sys/wait.h>
#include <unistd.h>

namespace appsync::fakes {

int inOtherProcess(const std::function<int()>& body) {
  const pid_t child = fork();
  if (child == 0) _exit(body());
  int status = 0;
  if (child < 0 || waitpid(child, &status, 0) != child) return -1;
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

}  // namespace appsync::fakes
