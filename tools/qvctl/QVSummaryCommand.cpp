#include "tools/qvctl/QVSummaryCommand.h"

#include "platform/QVText.h"
#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVPlot.h"
#include "tools/qvctl/QVTable.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <string_view>
#include <utility>

#include <fnmatch.h>
#include <unistd.h>

namespace {

using Style = QVToolOutput::Style;

// Where there is no terminal to ask.
constexpr std::size_t kUsualColumns = 80;
// Of the numbers beside a picture.
constexpr std::size_t kLabelColumns = 13;
constexpr std::size_t kSmallestColumns = 8;
// Of applications and files in the list, on a narrow terminal.
constexpr std::size_t kLeastOfNames = 11;

std::string environment(const char* name) {
  // There is one thread.
  const char* const value = std::getenv(name);  // NOLINT(concurrency-mt-unsafe)
  return value == nullptr ? std::string() : std::string(value);
}

// Does the terminal show other characters than ASCII?
bool isUnicode() {
  std::string locale = environment("LC_ALL");
  if (locale.empty()) locale = environment("LC_CTYPE");
  if (locale.empty()) locale = environment("LANG");
  return locale.find("UTF-8") != std::string::npos || locale.find("utf8") != std::string::npos;
}

bool isWanted(const std::vector<std::string>& patterns, const std::string& key) {
  return patterns.empty() || std::ranges::any_of(patterns, [&key](const std::string& pattern) {
           return ::fnmatch(pattern.c_str(), key.c_str(), 0) == 0;
         });
}

// Six digits, which is no more than a label has room for: "-1.79769e+308".
std::string edgeText(double number) {
  char text[32];
  std::snprintf(text, sizeof text, "%.6g", number);
  return text;
}

std::string label(std::string text) {
  text.insert(0, kLabelColumns - std::min(kLabelColumns, text.size()), ' ');
  return text.append(" |");
}

void drawColumn(QVToolOutput& output, const std::string& key, const QVSummaryFile::Column& column,
                const QVSummaryFile::Columns& all, QVPlot& plot) {
  double lowest = column.front().second;
  double highest = lowest;
  for (const auto& [message, number] : column) {
    lowest = std::min(lowest, number);
    highest = std::max(highest, number);
  }
  output.line(
      output.painted(Style::title, QVDisplayText(key)) +
      QVText("  ", column.size(), " of ", all.messages, " messages, last ", column.back().second));
  const std::vector<std::string> rows = plot.draw(column, 1, all.messages);
  for (std::size_t i = 0; i < rows.size(); ++i) {
    std::string edge;
    const bool isLevel = lowest == highest;
    if (isLevel ? i == rows.size() / 2 : i == 0) edge = edgeText(highest);
    if (!isLevel && i + 1 == rows.size()) edge = edgeText(lowest);
    std::string line = label(edge) + rows[i];
    line.erase(line.find_last_not_of(' ') + 1);
    output.line(line);
  }
}

QVValue jsonOf(const QVSummaryFile::Column& column) {
  std::vector<QVValue> messages;
  std::vector<QVValue> numbers;
  for (const auto& [message, number] : column) {
    messages.emplace_back(message);
    numbers.emplace_back(number);
  }
  return QVDictionary{{"messages", QVArray::assemble(messages)},
                      {"values", QVArray::assemble(numbers)}};
}

}  // namespace

QVToolStatus QVSummaryCommand::run(const QVToolContext& context, const Options& options) {
  if (options.operation == Operation::list) {
    list(context);
    return QVToolStatus::done;
  }
  const QVSummaryFile file = QVSummaryFile::choose(context.places.summaries(), options.file);
  if (options.operation == Operation::show) show(context, file);
  if (options.operation == Operation::open) open(file);
  if (options.operation == Operation::plot) plot(context, options, file);
  return QVToolStatus::done;
}

void QVSummaryCommand::list(const QVToolContext& context) {
  const std::vector<QVSummaryFile> files = QVSummaryFile::list(context.places.summaries());
  if (context.output.isJSON()) {
    std::vector<QVValue> all;
    for (const QVSummaryFile& file : files) {
      all.emplace_back(QVDictionary{{"file", file.path().string()},
                                    {"date", file.date()},
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
    table.add({std::to_string(i + 1), file.dateText(), file.service(), file.application(),
               std::to_string(file.bytes()), file.path().filename().string()});
  }
  table.print();
}

void QVSummaryCommand::show(const QVToolContext& context, const QVSummaryFile& file) {
  const QVArray contents = file.contents();
  if (context.output.isJSON()) {
    context.output.json(contents);
    return;
  }
  const std::string text = file.text();
  std::string_view rest = text;
  while (!rest.empty()) {
    const std::size_t end = std::min(rest.find('\n'), rest.size());
    context.output.line(QVDisplayText(QVDisplayJSON(rest.substr(0, end))));
    rest.remove_prefix(std::min(end + 1, rest.size()));
  }
}

void QVSummaryCommand::open(const QVSummaryFile& file) {
  // Says what is wrong with it before another program does.
  static_cast<void>(file.contents());
  // The program inherits what it would have without qvctl.
  static_cast<void>(std::signal(SIGPIPE, SIG_DFL));
  const bool hasDesktop =
      !environment("WAYLAND_DISPLAY").empty() || !environment("DISPLAY").empty();
  const std::string path = std::filesystem::absolute(file.path()).string();
  if (hasDesktop) ::execlp("xdg-open", "xdg-open", path.c_str(), nullptr);
  // PAGER is a command with arguments, and the shell's to take apart.
  ::execl("/bin/sh", "sh", "-c", "exec ${PAGER:-less} \"$1\"", "qvctl", path.c_str(), nullptr);
  throw QVToolFailure::ofSystem("/bin/sh", errno);
}

void QVSummaryCommand::plot(const QVToolContext& context, const Options& options,
                            const QVSummaryFile& file) {
  QVSummaryFile::Columns columns = QVSummaryFile::columns(file.contents());
  std::erase_if(columns.byKey,
                [&options](const auto& column) { return !isWanted(options.keys, column.first); });
  if (context.output.isJSON()) {
    std::vector<QVDictionaryEntry> all;
    for (const auto& [key, column] : columns.byKey) all.push_back({key, jsonOf(column)});
    context.output.json(QVDictionary{{"file", file.path().string()},
                                     {"messages", columns.messages},
                                     {"columns", QVDictionary::assemble(all)}});
    return;
  }
  if (columns.byKey.empty()) {
    throw QVToolFailure(QVToolStatus::failed,
                        QVText(file.path().string(), ": its messages hold no such numbers"));
  }
  std::size_t width = options.width != 0 ? options.width : context.output.columns();
  if (width == 0) width = kUsualColumns;
  const std::size_t beside = kLabelColumns + 2;
  const std::size_t left = width > beside ? width - beside : 0;
  QVPlot plot({.columns = std::clamp(left, kSmallestColumns, kLargestColumns),
               .rows = std::clamp<std::size_t>(options.height, 1, kLargestRows)},
              options.ascii || !isUnicode() ? QVPlot::Dots::ascii : QVPlot::Dots::braille);
  context.output.line(QVDisplayText(file.path().filename().string()));
  for (const auto& [key, column] : columns.byKey) {
    context.output.line("");
    drawColumn(context.output, key, column, columns, plot);
  }
}
