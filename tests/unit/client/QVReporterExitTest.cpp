// A program that keeps its reporter until it has left main(): what it sent still reaches the
// service.

#include "tests/unit/client/QVReporterFixture.h"

#include <cstdio>
#include <cstdlib>

#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr int kMessages = 1'000;  // more than may be under way

// The program's globals; says through a pipe when they begin to go, which is after everything that
// was made later, as the library's own constants may be.
struct Globals {
  ~Globals() {
    if (pipe >= 0 && ::write(pipe, "x", 1) != 1) std::abort();
  }

  std::unique_ptr<QVReporterSession> session;  // goes after the reporter
  std::unique_ptr<QVReporter> reporter;
  int pipe = -1;
};
Globals globals;

class QVReporterExitTest : public QVReporterFixture {
 protected:
  // The program; never returns.
  [[noreturn]] void run(int pipe) {
    QVReporterOptions given = options();
    given.endTimeLimit = kPatience;
    given.dropped = nullptr;
    globals.reporter = std::move(QVReporter::open(std::move(given)).value());
    auto opened = globals.reporter->openSession(
        {.reporterID = 7, .serviceType = QVClientServiceType::telephony});
    globals.session = std::move(opened.value());
    if (globals.reporter->flush(kPatience) != Code::none) std::_Exit(2);
    for (int i = 0; i < kMessages; ++i) {
      if (send(*globals.session, i) != Code::none) std::_Exit(3);
    }
    globals.pipe = pipe;
    std::exit(0);
  }
};

TEST_F(QVReporterExitTest, WhatAProgramSentIsSentWhenItHasLeftMain) {
  int ends[2];
  ASSERT_EQ(::pipe(ends), 0);
  std::fflush(nullptr);
  const pid_t program = ::fork();
  ASSERT_GE(program, 0);
  if (program == 0) run(ends[1]);
  ::close(ends[1]);
  const auto service = accept();
  serve(*service, 2);
  char leaving = 0;
  EXPECT_EQ(::read(ends[0], &leaving, 1), 1);
  ::close(ends[0]);
  for (int i = 0; i < kMessages && !HasFailure(); ++i) {
    EXPECT_EQ(serve(*service), "send 7 " + std::to_string(i));
  }
  service->hangUp();
  int status = -1;
  EXPECT_EQ(::waitpid(program, &status, 0), program);
  EXPECT_EQ(status, 0);
}

}  // namespace
