#include "platform/linux/tally/QVChannelConfiguration.h"

#include "platform/linux/files/QVJSONFile.h"

#include <string_view>

namespace {

constexpr const char* kFunction = "+[QVChannelConfiguration read:]";

// The string under the key; none where there is none or another kind of value.
std::optional<std::string> text(const QVDictionary& entry, std::string_view key) {
  const QVValue* const value = entry.find(key);
  if (value == nullptr || !value->isString()) return std::nullopt;
  return std::string(value->string());
}

// Reads one file's entries and says what is wrong with them.
class Reader {
 public:
  Reader(QVLog& log, const std::string& path) : log_(log), path_(path) {}

  std::optional<QVKernelTextSource::Description> entry(std::size_t number, const QVValue& value) {
    number_ = number;
    if (value.kind() != QVValue::Kind::dictionary) return refuse("it is no object");
    const QVDictionary entry = value.dictionary();
    const auto group = text(entry, "group");
    if (!group || group->empty()) return refuse("\"group\" is no name");
    auto subgroup = text(entry, "subgroup");
    if (!subgroup && entry.find("subgroup") != nullptr) return refuse("\"subgroup\" is no string");
    const auto file = text(entry, "file");
    if (!file || !file->starts_with('/') || file->find('\0') != std::string::npos) {
      return refuse("\"file\" is no absolute path");
    }
    QVKernelTextSource::Description description{
        .group = *group, .subgroup = std::move(subgroup), .file = *file, .channels = {}};
    const QVValue* const named = entry.find("channels");
    if (named == nullptr) return description;
    if (named->kind() != QVValue::Kind::dictionary) return refuse("\"channels\" is no object");
    description.channels = channels(named->dictionary());
    return description;
  }

 private:
  std::optional<QVKernelTextSource::Description> refuse(std::string_view reason) {
    log_.error(nullptr, kFunction, "entry ", number_, " of ", path_, " is left out: ", reason);
    return std::nullopt;
  }

  std::vector<std::pair<std::string, std::string>> channels(const QVDictionary& named) {
    std::vector<std::pair<std::string, std::string>> channels;
    for (const QVDictionaryEntry& channel : named) {
      if (channels.size() == QVChannelConfiguration::kMaximumChannels) {
        log_.error(nullptr, kFunction, "channels of entry ", number_, " of ", path_,
                   " beyond the first ", channels.size(), " are left out");
        break;
      }
      if (channel.value.isString()) {
        channels.emplace_back(channel.key, channel.value.string());
      } else {
        log_.error(nullptr, kFunction, "channel ", channel.key, " of entry ", number_, " of ",
                   path_, " is left out: its key is no string");
      }
    }
    return channels;
  }

  QVLog& log_;
  const std::string& path_;
  std::size_t number_ = 0;
};

}  // namespace

std::vector<QVKernelTextSource::Description> QVChannelConfiguration::read(QVLog& log,
                                                                          const std::string& path) {
  QVJSONFailure failure;
  std::optional<QVValue> value = QVJSONFile::read(path, failure);
  if (value && value->kind() != QVValue::Kind::array) {
    failure = {.reason = "not an array", .line = 1, .column = 1};
    value.reset();
  }
  if (!value) {
    if (!failure.missing) {
      log.error(nullptr, kFunction, "cannot read driver channels ", path, ": ",
                failure.description());
    }
    return {};
  }
  std::vector<QVKernelTextSource::Description> descriptions;
  Reader reader(log, path);
  std::size_t number = 0;
  for (const QVValue& entry : value->array()) {
    if (++number > kMaximumEntries) {
      log.error(nullptr, kFunction, "entries of ", path, " beyond the first ", kMaximumEntries,
                " are left out");
      break;
    }
    if (auto description = reader.entry(number, entry)) {
      descriptions.push_back(*std::move(description));
    }
  }
  return descriptions;
}
