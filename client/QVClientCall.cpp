#include "client/QVClientCall.h"

#include "platform/linux/bus/QVBusMessage.h"
#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusSignature.h"

#include <charconv>
#include <string>
#include <string_view>
#include <type_traits>

namespace {

// An error object's name is its domain, this, and its code.
constexpr std::string_view kCodeMark = ".Code";

template <class Value>
struct Answer;

template <>
struct Answer<bool> {
  static constexpr std::string_view kSignature = "b";
  static bool read(QVBusReader& reader) { return reader.readBoolean(); }
};

template <>
struct Answer<QVClientServiceType> {
  static constexpr std::string_view kSignature = "q";
  static QVClientServiceType read(QVBusReader& reader) {
    return static_cast<QVClientServiceType>(reader.readNumber<uint16_t>());
  }
};

template <>
struct Answer<std::vector<int64_t>> {
  static constexpr std::string_view kSignature = "ax";
  static std::vector<int64_t> read(QVBusReader& reader) {
    const std::size_t end = reader.enterArray(8);
    std::vector<int64_t> reporterIDs;
    if (reader.ok()) reporterIDs.reserve((end - reader.position()) / sizeof(int64_t));
    while (reader.position() < end) reporterIDs.push_back(reader.readNumber<int64_t>());
    reader.leaveArray(end);
    return reporterIDs;
  }
};

template <>
struct Answer<QVClientReporter> {
  static constexpr std::string_view kSignature = "a{sv}";
  static QVClientReporter read(QVBusReader& reader) {
    QVClientReporter reporter;
    const std::size_t end = reader.enterArray(8);
    while (reader.position() < end) {
      reader.enterStruct();
      const std::string_view key = reader.readString();
      const std::string_view type = reader.enterVariantText();
      if (key == "reporterID" && type == "x") {
        reporter.reporterID = reader.readNumber<int64_t>();
      } else if (key == "serviceType" && type == "q") {
        reporter.serviceType = static_cast<QVClientServiceType>(reader.readNumber<uint16_t>());
      } else if (QVBusSignature signature; reader.parseVariantSignature(type, signature)) {
        reader.skipValue(signature, 0);
      }
      reader.leaveVariant();
      reader.leaveStruct();
    }
    reader.leaveArray(end);
    return reporter;
  }
};

QVClientError wrongAnswer(const char* what) {
  return {QVClientError::Code::invalidReply,
          std::string("the service's answer is not what the operation answers: ") + what};
}

QVClientError errorOf(const QVBusMessage& answer) {
  std::string text;
  if (answer.signature().starts_with('s')) {
    QVBusReader reader = answer.bodyReader();
    text = reader.readString();
  }
  const std::string_view name = answer.errorName();
  const std::size_t mark = name.rfind(kCodeMark);
  if (mark != std::string_view::npos) {
    const std::string_view digits = name.substr(mark + kCodeMark.size());
    int64_t code = 0;
    const auto [end, problem] = std::from_chars(digits.data(), digits.data() + digits.size(), code);
    if (problem == std::errc() && end == digits.data() + digits.size()) {
      return QVClientError::ofService(std::string(name.substr(0, mark)), code, std::move(text));
    }
  }
  if (text.empty()) text = name;
  return QVClientError::refusal(std::string(name), std::move(text));
}

template <class Value>
QVClientResult<Value> resultOf(const QVBusMessage& answer) {
  if (answer.type() == QVBusMessageType::error) return errorOf(answer);
  if (answer.signature() != Answer<Value>::kSignature) return wrongAnswer("another type");
  QVBusReader reader = answer.bodyReader();
  Value value = Answer<Value>::read(reader);
  if (!reader.ok()) return wrongAnswer(reader.failure());
  return value;
}

void finish(std::monostate /*nobody*/, const QVBusMessage& /*answer*/) {}

void finish(const QVClientMessageReply& reply, const QVBusMessage& answer) {
  if (answer.type() == QVBusMessageType::error) {
    reply(errorOf(answer));
  } else {
    reply(answer.signature().empty() ? QVClientError() : wrongAnswer("a value"));
  }
}

template <class Value>
void finish(const std::function<void(const QVClientResult<Value>&)>& reply,
            const QVBusMessage& answer) {
  reply(resultOf<Value>(answer));
}

void fail(std::monostate /*nobody*/, const QVClientError& /*error*/) {}

template <class Outcome>
void fail(const std::function<void(const Outcome&)>& reply, const QVClientError& error) {
  reply(error);
}

}  // namespace

void QVClientFinish(const QVClientCall& call, const QVBusMessage& answer) {
  std::visit([&answer](const auto& reply) { finish(reply, answer); }, call.reply);
}

void QVClientFail(const QVClientCall& call, const QVClientError& error) {
  if (call.endsService && error.code() == QVClientError::Code::connectionLost) {
    if (const auto* reply = std::get_if<QVClientBooleanReply>(&call.reply)) (*reply)(true);
    return;
  }
  std::visit([&error](const auto& reply) { fail(reply, error); }, call.reply);
}
