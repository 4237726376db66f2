#include "platform/fake/QVFakeLog.h"

#include <thread>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

QVLogScope* registerScope(QVFakeLog& log) {
  return log.registerScope(true, 0x71767273, "qvrs", "net.quillon.quietvox",
                           "reporting_server_verbose", 31);
}

TEST(QVFakeLogTest, KeepsLinesWithTheirOrigin) {
  QVFakeLog log;
  QVLogScope* const scope = registerScope(log);
  log.standard(scope, "-[QVReportingServiceDelegate init]", "text ", 1);
  const uint32_t line = __LINE__ - 1;
  log.error(nullptr, "function", "bad");
  const auto lines = log.lines();
  ASSERT_EQ(lines.size(), 2U);
  EXPECT_EQ(lines[0],
            (QVFakeLog::Line{QVLogLevel::standard, "qvrs", "-[QVReportingServiceDelegate init]",
                             "text 1", "QVFakeLogTest.cpp", line}));
  EXPECT_THAT(log.renderings(), ElementsAre("5[qvrs] -[QVReportingServiceDelegate init]: text 1",
                                            "3[default] function: bad"));
  EXPECT_THAT(log.renderingsOfScope("default"), ElementsAre("3[default] function: bad"));
  log.clear();
  EXPECT_THAT(log.lines(), IsEmpty());
}

TEST(QVFakeLogTest, RecordsRegistrationsAndReadsTheSwitchAtEach) {
  QVFakeLog log;
  QVLogScope* const scope = registerScope(log);
  EXPECT_FALSE(QVLog::logEnabled(QVLog::kVerbose, scope));
  log.verbose(scope, "f", "unseen");
  log.setVerbose("reporting_server_verbose", true);
  EXPECT_FALSE(QVLog::logEnabled(QVLog::kVerbose, scope)) << "read at registration only";
  EXPECT_EQ(registerScope(log), scope);
  log.verbose(scope, "f", "seen");
  EXPECT_THAT(log.renderings(), ElementsAre("7[qvrs] f: seen"));
  const QVFakeLog::Registration expected{
      true, 0x71767273, "qvrs", "net.quillon.quietvox", "reporting_server_verbose", 31};
  EXPECT_THAT(log.registrations(), ElementsAre(expected, expected));
  EXPECT_EQ(scope->code, 0x71767273U);
  EXPECT_EQ(scope->subsystem, "net.quillon.quietvox");
}

TEST(QVFakeLogTest, TakesLinesFromSeveralThreads) {
  QVFakeLog log;
  std::thread other([&log] {
    for (int i = 0; i < 100; ++i) log.info(nullptr, "other", i);
  });
  for (int i = 0; i < 100; ++i) log.info(nullptr, "own", i);
  other.join();
  EXPECT_EQ(log.lines().size(), 200U);
}

}  // namespace
