#include "tests/e2e/TracedRun.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

namespace kx::test {
namespace {

bool leavesATrace(const __ptrace_syscall_info& info) {
  switch (info.entry.nr) {
    case SYS_openat:
      return (info.entry.args[2] & O_CREAT) != 0;
    case SYS_write:
    case SYS_pwrite64:
    case SYS_pwritev:
    case SYS_copy_file_range:
    case SYS_sendfile:
    case SYS_fsync:
    case SYS_fdatasync:
    case SYS_syncfs:
    case SYS_sync_file_range:
    case SYS_rename:
    case SYS_renameat:
    case SYS_renameat2:
    case SYS_unlink:
    case SYS_unlinkat:
    case SYS_rmdir:
    case SYS_mkdir:
    case SYS_mkdirat:
    case SYS_link:
    case SYS_linkat:
    case SYS_truncate:
    case SYS_ftruncate:
    case SYS_fallocate:
    case SYS_openat2:
      return true;
    default:
      return false;
  }
}

std::vector<char*> argumentPointers(const std::vector<std::string>& arguments) {
  std::vector<char*> pointers;
  for (const std::string& argument : arguments) {
    pointers.push_back(const_cast<char*>(argument.c_str()));
  }
  pointers.push_back(nullptr);
  return pointers;
}

[[noreturn]] void runChild(const std::vector<std::string>& arguments, int output, bool traced) {
  const int nothing = ::open("/dev/null", O_RDWR);
  ::dup2(nothing, 0);
  ::dup2(output < 0 ? nothing : output, 1);
  ::dup2(nothing, 2);
  if (traced) {
    // The leak check of a sanitized build cannot work under a tracer.
    const char* const given = std::getenv("ASAN_OPTIONS");
    const std::string options = given != nullptr ? std::string(given) + ":" : std::string();
    ::setenv("ASAN_OPTIONS", (options + "detect_leaks=0").c_str(), 1);
    ::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
    ::raise(SIGSTOP);
  }
  ::execv(arguments[0].c_str(), argumentPointers(arguments).data());
  ::_exit(127);
}

int exitCodeOf(int status) {
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

class Tracer {
 public:
  Tracer(pid_t child, std::uint64_t killBefore) : child_(child), killBefore_(killBefore) {}

  TracedRun follow() {
    int status = 0;
    if (::waitpid(child_, &status, 0) != child_ || !WIFSTOPPED(status)) {
      throw std::runtime_error("the child did not stop");
    }
    const long options = PTRACE_O_TRACESYSGOOD | PTRACE_O_TRACECLONE | PTRACE_O_EXITKILL;
    if (::ptrace(PTRACE_SETOPTIONS, child_, nullptr, options) != 0) {
      throw std::runtime_error(std::string("ptrace: ") + std::strerror(errno));
    }
    ::ptrace(PTRACE_SYSCALL, child_, nullptr, nullptr);
    for (;;) {
      const pid_t thread = ::waitpid(-1, &status, __WALL);
      if (thread < 0) {
        if (errno == EINTR) continue;
        break;
      }
      if (WIFEXITED(status) || WIFSIGNALED(status)) {
        if (thread == child_) run_.exitCode = exitCodeOf(status);
        continue;
      }
      if (WIFSTOPPED(status)) goOn(thread, WSTOPSIG(status), status >> 16);
    }
    return run_;
  }

 private:
  void goOn(pid_t thread, int signal, int event) {
    long deliver = 0;
    if (signal == (SIGTRAP | 0x80)) {
      count(thread);
    } else if (signal != SIGTRAP && signal != SIGSTOP && event == 0) {
      deliver = signal;
    }
    ::ptrace(PTRACE_SYSCALL, thread, nullptr, deliver);
  }

  void count(pid_t thread) {
    __ptrace_syscall_info info{};
    // NOLINTNEXTLINE: the size goes where an address is expected
    ::ptrace(PTRACE_GET_SYSCALL_INFO, thread, reinterpret_cast<void*>(sizeof info), &info);
    if (info.op != PTRACE_SYSCALL_INFO_ENTRY || run_.killed || !leavesATrace(info)) return;
    if (++run_.effects != killBefore_) return;
    run_.killed = true;
    ::kill(child_, SIGKILL);
  }

  pid_t child_;
  std::uint64_t killBefore_;
  TracedRun run_;
};

}  // namespace

TracedRun runTraced(const std::vector<std::string>& arguments, std::uint64_t killBefore) {
  const pid_t child = ::fork();
  if (child < 0) throw std::runtime_error("fork failed");
  if (child == 0) runChild(arguments, -1, true);
  return Tracer(child, killBefore).follow();
}

std::string runForOutput(const std::vector<std::string>& arguments, int* exitCode) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  const pid_t child = ::fork();
  if (child < 0) throw std::runtime_error("fork failed");
  if (child == 0) runChild(arguments, ends[1], false);
  ::close(ends[1]);
  std::string output;
  char buffer[65536];
  for (ssize_t got = 0; (got = ::read(ends[0], buffer, sizeof buffer)) > 0;) {
    output.append(buffer, static_cast<std::size_t>(got));
  }
  ::close(ends[0]);
  int status = 0;
  ::waitpid(child, &status, 0);
  *exitCode = exitCodeOf(status);
  return output;
}

bool canTrace() {
  try {
    return runTraced({"/bin/true"}, 0).exitCode == 0;
  } catch (const std::runtime_error&) {
    return false;
  }
}

}  // namespace kx::test
