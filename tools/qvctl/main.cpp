// qvctl: controls and inspects the service from a terminal or a script.

#include "tools/qvctl/QVCommandLine.h"
#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVToolOutput.h"

#include <csignal>
#include <exception>

namespace {

QVToolStatus runCommand(int argc, char** argv, bool ignoresPipes) {
  QVCommandLine commandLine;
  auto status = QVToolStatus::done;
  if (!commandLine.parse(argc, argv, status)) return status;
  QVToolOutput output(commandLine.wantsJSON());
  const QVToolContext context{commandLine.places(), output, ignoresPipes};
  status = commandLine.run(context);
  output.flush();
  return status;
}

}  // namespace

int main(int argc, char** argv) {
  // Whoever reads may go away; that is no failure, and has to be told from one.
  const bool ignoresPipes = std::signal(SIGPIPE, SIG_IGN) == SIG_IGN;
  try {
    return static_cast<int>(runCommand(argc, argv, ignoresPipes));
  } catch (const QVReaderGone&) {
    return static_cast<int>(QVToolStatus::done);
  } catch (const QVToolFailure& failure) {
    QVToolOutput::note(failure.what());
    return static_cast<int>(failure.status());
  } catch (const std::exception& failure) {
    QVToolOutput::note(failure.what());
    return static_cast<int>(QVToolStatus::failed);
  }
}
