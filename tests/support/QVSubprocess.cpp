#include "tests/support/QVSubprocess.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr int kFirstInheritedDescriptor = 3;

void redirect(const std::string& file, int descriptor) {
  if (file.empty()) return;
  const int opened = ::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  if (opened < 0 || ::dup2(opened, descriptor) < 0) ::_exit(126);
}

[[noreturn]] void becomeChild(const QVSubprocess::Options& options) {
  redirect(options.standardOutputFile, STDOUT_FILENO);
  redirect(options.standardErrorFile, STDERR_FILENO);
  if (options.inheritedDescriptor >= 0) {
    if (options.inheritedDescriptor == kFirstInheritedDescriptor) {
      ::fcntl(kFirstInheritedDescriptor, F_SETFD, 0);
    } else if (::dup2(options.inheritedDescriptor, kFirstInheritedDescriptor) < 0) {
      ::_exit(126);
    }
    ::setenv("LISTEN_FDS", "1", 1);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  }
  QVSubprocess::execute(options.arguments, options.environment);
}

}  // namespace

QVSubprocess::QVSubprocess(const Options& options) {
  pid_ = ::fork();
  if (pid_ < 0) throw std::runtime_error("cannot fork");
  if (pid_ == 0) becomeChild(options);
  pidDescriptor_ = static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0));
}

QVSubprocess::~QVSubprocess() {
  if (!status_) {
    ::kill(pid_, SIGKILL);
    wait(std::chrono::seconds(60));
  }
  if (pidDescriptor_ >= 0) ::close(pidDescriptor_);
}

void QVSubprocess::signal(int number) const {
  if (!status_) ::kill(pid_, number);
}

std::optional<QVSubprocess::Status> QVSubprocess::wait(std::chrono::milliseconds limit) {
  if (status_) return status_;
  pollfd ended{pidDescriptor_, POLLIN, 0};
  int polled;
  do {
    polled = ::poll(&ended, 1, static_cast<int>(limit.count()));
  } while (polled < 0 && errno == EINTR);
  if (polled != 1) return std::nullopt;
  int raw = 0;
  pid_t collected;
  do {
    collected = ::waitpid(pid_, &raw, 0);
  } while (collected < 0 && errno == EINTR);
  if (collected != pid_) throw std::runtime_error("a child process ended unseen");
  status_ = statusOf(raw);
  return status_;
}

void QVSubprocess::execute(const std::vector<std::string>& arguments,
                           const std::map<std::string, std::string>& environment) {
  for (const auto& [name, value] : environment) ::setenv(name.c_str(), value.c_str(), 1);
  std::vector<char*> pointers;
  for (const std::string& argument : arguments) {
    pointers.push_back(const_cast<char*>(argument.c_str()));
  }
  pointers.push_back(nullptr);
  ::execvp(pointers.front(), pointers.data());
  ::_exit(127);
}

QVSubprocess::Status QVSubprocess::statusOf(int raw) {
  return WIFEXITED(raw) ? WEXITSTATUS(raw) : -WTERMSIG(raw);
}

QVSubprocess::Output QVSubprocess::run(const std::vector<std::string>& arguments,
                                       std::chrono::milliseconds limit) {
  std::string file = (std::filesystem::temp_directory_path() / "quietvox-out-XXXXXX").string();
  const int descriptor = ::mkstemp(file.data());
  if (descriptor < 0) throw std::runtime_error("cannot make " + file);
  ::close(descriptor);
  Output output{-SIGKILL, {}};
  {
    QVSubprocess process(
        {.arguments = arguments, .standardOutputFile = file, .standardErrorFile = file});
    if (const auto status = process.wait(limit)) output.status = *status;
  }
  std::ifstream stream(file);
  output.text.assign(std::istreambuf_iterator<char>(stream), {});
  std::filesystem::remove(file);
  return output;
}
