#include "tools/qvctl/QVSummaryCommand.h"

#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVEnvironment.h"
#include "tools/qvctl/QVTable.h"
#include "tools/qvctl/QVTimeText.h"

#include <cerrno>
#include <csignal>
#include <string_view>
#include <utility>

#include <unistd.h>

namespace {

// Of applications and files in the list, on a narrow terminal.
constexpr std::size_t kLeastOfNames = 11;

// Leaves out what is between the words of JSON text that is in order and comes in parts.
class BlankRemover {
 public:
  std::string without(std::string_view part) {
    std::string text;
    text.reserve(part.size());
    for (const char character : part) {
      const bool isBlank = std::string_view(" \t\r\n").find(character) != std::string_view::npos;
      if (isString_ || !isBlank) text.push_back(character);
      const bool isPlain = !std::exchange(isEscape_, isString_ && !isEscape_ && character == '\\');
      if (isPlain && character == '"') isString_ = !isString_;
    }
    return text;
  }

 private:
  bool isString_ = false;
  bool isEscape_ = false;  // is the next character one that a backslash makes another?
};

}  // namespace

QVToolStatus QVSummaryCommand::run(const QVToolContext& context, const Options& options) {
  if (options.operation == Operation::list) {
    list(context);
    return QVToolStatus::done;
  }
  const QVSummaryFile file = QVSummaryFile::choose(context.places.summaries(), options.file);
  if (options.operation == Operation::show) show(context, file);
  if (options.operation == Operation::open) open(context, file);
  if (options.operation == Operation::plot) {
    QVSummaryPlot(context.output, file, options.plot).show();
  }
  return QVToolStatus::done;
}

void QVSummaryCommand::list(const QVToolContext& context) {
  const std::vector<QVSummaryFile> files = QVSummaryFile::list(context.places.summaries());
  if (context.output.isJSON()) {
    std::vector<QVValue> all;
    for (const QVSummaryFile& file : files) {
      all.emplace_back(QVDictionary{{"file", file.path().string()},
                                    {"date", QVUniversalTimeText(file.stopped())},
                                    {"application", file.application()},
                                    {"service", file.service()},
                                    {"bytes", file.bytes()}});
    }
    context.output.json(QVArray::assemble(all));
    return;
  }
  QVTable table(context.output, {{"N", QVTable::Align::right},
                                 {"STOPPED"},
                                 {"SERVICE"},
                                 {.title = "APPLICATION", .least = kLeastOfNames},
                                 {"BYTES", QVTable::Align::right},
                                 {.title = "FILE", .least = kLeastOfNames}});
  for (std::size_t i = 0; i < files.size(); ++i) {
    const QVSummaryFile& file = files[i];
    table.add({std::to_string(i + 1), QVLocalTimeText(file.stopped(), false), file.service(),
               file.application(), std::to_string(file.bytes()), file.path().filename().string()});
  }
  table.print();
}

void QVSummaryCommand::show(const QVToolContext& context, const QVSummaryFile& file) {
  // What is broken is not shown in part.
  file.check();
  QVToolOutput& output = context.output;
  if (output.isJSON()) {
    BlankRemover blanks;
    file.read([&](std::string_view part) { output.raw(QVDisplayJSON(blanks.without(part))); });
    output.line("");
    return;
  }
  bool isLineOver = true;
  file.read([&](std::string_view part) {
    isLineOver = part.ends_with('\n');
    std::string text = QVDisplayJSON(part);
    // Of what may stand between the words of JSON text, what overwrites a terminal's line.
    std::erase(text, '\r');
    output.raw(text);
  });
  if (!isLineOver) output.line("");
}

void QVSummaryCommand::open(const QVToolContext& context, const QVSummaryFile& file) {
  // Says what is wrong with it before another program does.
  file.check();
  // The program inherits what it would have without qvctl.
  if (!context.ignoresPipes) static_cast<void>(std::signal(SIGPIPE, SIG_DFL));
  const bool hasDesktop =
      !QVEnvironment("WAYLAND_DISPLAY").empty() || !QVEnvironment("DISPLAY").empty();
  const std::string path = std::filesystem::absolute(file.path()).string();
  if (hasDesktop) ::execlp("xdg-open", "xdg-open", path.c_str(), nullptr);
  // PAGER is a command with arguments, and the shell's to take apart.
  ::execl("/bin/sh", "sh", "-c", "exec ${PAGER:-less} \"$1\"", "qvctl", path.c_str(), nullptr);
  throw QVToolFailure::ofSystem("/bin/sh", errno);
}
