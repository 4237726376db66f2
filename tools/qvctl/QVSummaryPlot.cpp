#include "tools/qvctl/QVSummaryPlot.h"

#include "platform/QVText.h"
#include "platform/linux/store/QVJSONText.h"
#include "tools/qvctl/QVDisplayText.h"
#include "tools/qvctl/QVEnvironment.h"
#include "tools/qvctl/QVPlot.h"
#include "tools/qvctl/QVSummaryNumbers.h"
#include "tools/qvctl/QVToolFailure.h"

#include <algorithm>
#include <cstdio>
#include <deque>
#include <iterator>
#include <utility>

#include <fnmatch.h>

namespace {

using Style = QVToolOutput::Style;

// Where there is no terminal to ask.
constexpr std::size_t kUsualColumns = 80;
// Of the numbers beside a picture, and of what parts them from it.
constexpr std::size_t kLabelColumns = 13;
constexpr std::string_view kBar = " |";

// Keys that a message names, of those that there are.
constexpr std::size_t kNamedKeys = 10;
// Columns of each of them: an application may call a number what it likes.
constexpr std::size_t kNamedColumns = 100;

// Does the terminal show other characters than ASCII?
bool isUnicode() {
  std::string locale = QVEnvironment("LC_ALL");
  if (locale.empty()) locale = QVEnvironment("LC_CTYPE");
  if (locale.empty()) locale = QVEnvironment("LANG");
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
  return text.append(kBar);
}

// What there is in place of the keys that were asked for.
std::string complaint(const std::vector<std::string>& wanted,
                      const std::vector<std::string>& keys) {
  if (keys.empty()) return "its messages hold no numbers";
  std::string text = "its messages hold no number that is called ";
  for (const std::string& pattern : wanted) {
    text.append(&pattern == wanted.data() ? "\"" : " or \"").append(pattern).append("\"");
  }
  text.append("; there are ");
  for (std::size_t i = 0; i < keys.size() && i < kNamedKeys; ++i) {
    text.append(i == 0 ? "" : ", ").append(keys[i]);
  }
  return keys.size() > kNamedKeys ? text.append(", ...") : text;
}

}  // namespace

void QVSummaryPlot::show() {
  findRanges();
  if (output_.isJSON()) {
    printJSON();
  } else {
    printPictures();
  }
}

void QVSummaryPlot::findRanges() {
  QVSummaryNumbers numbers([this](const std::string& key, int64_t /*message*/, double number) {
    const auto known = ranges_.find(key);
    if (known == ranges_.end()) {
      if (ranges_.size() >= kMaximumKeys || !isWanted(options_.keys, key)) {
        leaveOut(key);
        return;
      }
    }
    Range& range = known == ranges_.end() ? ranges_[key] : known->second;
    range.lowest = range.count == 0 ? number : std::min(range.lowest, number);
    range.highest = range.count == 0 ? number : std::max(range.highest, number);
    range.last = number;
    ++range.count;
  });
  file_.scan(numbers);
  messages_ = numbers.messages();
  if (ranges_.empty()) {
    const std::vector<std::string> keys(others_.begin(), others_.end());
    throw QVToolFailure(QVToolStatus::failed,
                        QVText(file_.path().string(), ": ", complaint(options_.keys, keys)));
  }
  if (!isCut_) return;
  QVToolOutput::note(QVText(file_.path().string(), ": it has more keys than the ", kMaximumKeys,
                            " that are shown; --key chooses others"));
}

void QVSummaryPlot::leaveOut(const std::string& key) {
  if (isWanted(options_.keys, key)) {
    isCut_ = true;
    return;
  }
  others_.insert(QVClippedText(key, kNamedColumns));
  // One more than are named, so that it shows that there are more.
  if (others_.size() > kNamedKeys + 1) others_.erase(std::prev(others_.end()));
}

void QVSummaryPlot::printPictures() const {
  std::size_t width = options_.width != 0 ? options_.width : output_.columns();
  if (width == 0) width = kUsualColumns;
  width = std::clamp(width, kSmallestColumns, kLargestColumns);
  const QVPlot::Size size{.columns = width - kLabelColumns - kBar.size(),
                          .rows = std::clamp<std::size_t>(options_.height, 1, kLargestRows)};
  const auto dots = options_.ascii || !isUnicode() ? QVPlot::Dots::ascii : QVPlot::Dots::braille;
  std::map<std::string, QVPlot> plots;
  for (const auto& [key, range] : ranges_) {
    plots.emplace(
        key,
        QVPlot(size, dots,
               {.first = 1, .last = messages_, .lowest = range.lowest, .highest = range.highest}));
  }
  QVSummaryNumbers numbers([&plots](const std::string& key, int64_t message, double number) {
    const auto plot = plots.find(key);
    if (plot != plots.end()) plot->second.add(message, number);
  });
  file_.scan(numbers);
  const std::string name = QVDisplayText(file_.path().filename().string());
  output_.line(output_.columns() == 0 ? name : QVClippedText(name, output_.columns()));
  for (const auto& [key, range] : ranges_) printPicture(key, range, plots.at(key).rows());
}

void QVSummaryPlot::printPicture(const std::string& key, const Range& range,
                                 const std::vector<std::string>& rows) const {
  output_.line("");
  std::string title = QVDisplayText(key);
  std::string rest = QVText("  ", range.count, " of ", messages_, " messages, last ", range.last);
  if (const std::size_t columns = output_.columns(); columns > 0) {
    title = QVClippedText(title, columns);
    rest = QVClippedText(rest, columns - QVDisplayWidth(title));
  }
  output_.line(output_.painted(Style::title, title) + rest);
  for (std::size_t i = 0; i < rows.size(); ++i) {
    std::string edge;
    const bool isLevel = range.lowest == range.highest;
    if (isLevel ? i == rows.size() / 2 : i == 0) edge = edgeText(range.highest);
    if (!isLevel && i + 1 == rows.size()) edge = edgeText(range.lowest);
    std::string line = label(edge) + rows[i];
    line.erase(line.find_last_not_of(' ') + 1);
    output_.line(line);
  }
}

void QVSummaryPlot::printJSON() const {
  std::map<std::string, std::deque<std::pair<int64_t, double>>> columns;
  for (const auto& [key, range] : ranges_) columns[key];
  QVSummaryNumbers numbers([&columns](const std::string& key, int64_t message, double number) {
    const auto column = columns.find(key);
    if (column != columns.end()) column->second.emplace_back(message, number);
  });
  file_.scan(numbers);
  QVJSONText text;
  const auto print = [&](std::string_view before, const QVValue& value) {
    output_.raw(before);
    output_.raw(QVDisplayJSON(text.write(value)));
  };
  std::string_view before = "{\"columns\":{";
  for (const auto& [key, column] : columns) {
    print(before, key);
    before = ":{\"messages\":[";
    for (const auto& [message, number] : column) print(std::exchange(before, ","), message);
    before = "],\"values\":[";
    for (const auto& [message, number] : column) print(std::exchange(before, ","), number);
    before = "]},";
  }
  print("]}},\"file\":", file_.path().string());
  print(",\"messages\":", messages_);
  output_.line("}");
}
