#include "platform/linux/tally/QVMMVFormat.h"

#include "platform/QVValue.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <type_traits>
#include <utility>

namespace {

constexpr int32_t kVersion = 1;
constexpr uint32_t kSentinelFlag = 4;
constexpr uint64_t kSentinel = UINT64_MAX;  // of integers; of floating-point numbers NaN

constexpr std::size_t kNameBytes = 64;  // with the NUL that ends it

enum SectionKind : int32_t { domains = 1, instances = 2, metrics = 3, values = 4, texts = 5 };

enum class Type : int32_t {
  signed32 = 0,
  unsigned32 = 1,
  signed64 = 2,
  unsigned64 = 3,
  real32 = 4,
  real64 = 5,
  elapsed = 9
};

// The elements, as they lie in the file.
struct Header {
  std::array<char, 4> magic;
  int32_t version;
  uint64_t generation;
  uint64_t generationAgain;
  int32_t sections;
  uint32_t flags;
  int32_t process;
  int32_t cluster;
};
struct Section {
  int32_t kind;
  int32_t count;
  uint64_t offset;
};
struct Domain {
  uint32_t serial;
  uint32_t count;
  uint64_t firstInstance;
  uint64_t shortText;
  uint64_t longText;
};
struct Instance {
  uint64_t domain;
  uint32_t padding;
  int32_t number;
  std::array<char, kNameBytes> name;
};
struct Metric {
  std::array<char, kNameBytes> name;
  uint32_t number;
  int32_t type;
  int32_t semantics;
  uint32_t unit;
  uint32_t domain;
  uint32_t padding;
  uint64_t shortText;
  uint64_t longText;
};
struct Value {
  uint64_t cell;
  int64_t extra;
  uint64_t metric;
  uint64_t instance;
};
constexpr std::size_t kTextBytes = 256;

static_assert(sizeof(Header) == QVMMVFormat::kHeaderBytes && sizeof(Section) == 16);
static_assert(sizeof(Domain) == 32 && sizeof(Instance) == 80);
static_assert(sizeof(Metric) == 104 && sizeof(Value) == 32);

// The element there; the caller has checked that there is one.
template <class Element>
Element elementAt(std::string_view bytes, std::size_t offset) {
  static_assert(std::is_trivially_copyable_v<Element>);
  Element element;
  std::memcpy(&element, bytes.data() + offset, sizeof element);
  return element;
}

// The elements of one kind.
struct Table {
  std::size_t offset = 0;
  std::size_t count = 0;
  std::size_t stride = 0;

  std::size_t end() const { return offset + count * stride; }
  // Does an element begin at that offset?
  bool holds(uint64_t element) const {
    return element >= offset && element < end() && (element - offset) % stride == 0;
  }
};

std::size_t elementBytes(int32_t kind) {
  switch (kind) {
    case domains:
      return sizeof(Domain);
    case instances:
      return sizeof(Instance);
    case metrics:
      return sizeof(Metric);
    case values:
      return sizeof(Value);
    case texts:
      return kTextBytes;
    default:
      return 0;
  }
}

bool overlap(const Table& one, const Table& other) {
  return one.count != 0 && other.count != 0 && one.offset < other.end() && other.offset < one.end();
}

bool hasDomain(const Metric& metric) {
  return metric.domain != 0 && metric.domain != UINT32_MAX;
}

// Reads one file's bytes. Each step answers whether they are in order.
class Parser {
 public:
  Parser(std::string_view bytes, const Header& header, QVChannelReadings& readings)
      : bytes_(bytes), header_(header), readings_(readings) {}

  bool run() { return readContents() && readSubgroups() && readMetrics() && readValues(); }

 private:
  const Table& table(SectionKind kind) const { return tables_[static_cast<std::size_t>(kind)]; }

  template <class Element>
  Element element(SectionKind kind, std::size_t index) const {
    return elementAt<Element>(bytes_, table(kind).offset + index * sizeof(Element));
  }

  // The text of a field, which has to end within it.
  std::optional<std::string_view> name(std::size_t offset) const {
    const std::string_view field = bytes_.substr(offset, kNameBytes);
    const std::size_t length = field.find('\0');
    if (length == std::string_view::npos) return std::nullopt;
    return field.substr(0, length);
  }

  bool readContents() {
    if (header_.sections < 0 || header_.sections > QVMMVFormat::kMaximumSections) return false;
    const auto count = static_cast<std::size_t>(header_.sections);
    if (count * sizeof(Section) > bytes_.size() - sizeof(Header)) return false;
    std::vector<Table> taken{{.offset = 0, .count = 1, .stride = sizeof(Header)},
                             {.offset = sizeof(Header), .count = count, .stride = sizeof(Section)}};
    for (std::size_t i = 0; i < count; ++i) {
      const auto section = elementAt<Section>(bytes_, sizeof(Header) + i * sizeof(Section));
      const std::size_t stride = elementBytes(section.kind);
      if (stride == 0) return false;
      Table& known = tables_[static_cast<std::size_t>(section.kind)];
      if (known.stride != 0) return false;  // there is one already
      if (section.count < 0 || section.offset > bytes_.size()) return false;
      const auto elements = static_cast<std::size_t>(section.count);
      if (elements > (bytes_.size() - section.offset) / stride) return false;
      known = {.offset = section.offset, .count = elements, .stride = stride};
      for (const Table& other : taken) {
        if (overlap(known, other)) return false;
      }
      taken.push_back(known);
    }
    return true;
  }

  bool readSubgroups() {
    for (std::size_t i = 0; i < table(instances).count; ++i) {
      const std::size_t offset = table(instances).offset + i * sizeof(Instance);
      const auto text = name(offset + offsetof(Instance, name));
      const auto instance = elementAt<Instance>(bytes_, offset);
      if (!text || !table(domains).holds(instance.domain)) return false;
      readings_.subgroups.emplace_back(text);
    }
    return true;
  }

  // A file without instances publishes the group itself, also where it has no channels.
  bool readMetrics() {
    bool ungrouped = table(instances).count == 0;
    for (std::size_t i = 0; i < table(metrics).count; ++i) {
      const std::size_t offset = table(metrics).offset + i * sizeof(Metric);
      if (!name(offset + offsetof(Metric, name))) return false;
      ungrouped = ungrouped || !hasDomain(elementAt<Metric>(bytes_, offset));
    }
    if (ungrouped) readings_.subgroups.emplace_back(std::nullopt);
    return true;
  }

  bool readValues() {
    readings_.channels.reserve(table(values).count);
    for (std::size_t i = 0; i < table(values).count; ++i) {
      const auto value = element<Value>(values, i);
      if (!table(metrics).holds(value.metric)) return false;
      const auto metric = elementAt<Metric>(bytes_, value.metric);
      QVChannelReadings::Channel channel;
      if (hasDomain(metric)) {
        if (!table(instances).holds(value.instance)) return false;
        const auto instance = elementAt<Instance>(bytes_, value.instance);
        if (elementAt<Domain>(bytes_, instance.domain).serial != metric.domain) return false;
        channel.subgroup = name(value.instance + offsetof(Instance, name));
      }
      if (!readCell(value.cell, metric.type, channel.value)) continue;
      channel.name = name(value.metric + offsetof(Metric, name)).value_or(std::string_view());
      readings_.channels.push_back(channel);
    }
    return true;
  }

  template <class Number>
  static Number cellAs(uint64_t cell) {
    Number number;
    std::memcpy(&number, &cell, sizeof number);  // the union's members all begin where it does
    return number;
  }

  // Is the type one that is counted?
  bool readCell(uint64_t cell, int32_t type, std::optional<int64_t>& value) const {
    QVValue number;
    switch (static_cast<Type>(type)) {
      case Type::signed32:
        number = cellAs<int32_t>(cell);
        break;
      case Type::unsigned32:
        number = cellAs<uint32_t>(cell);
        break;
      case Type::signed64:
      case Type::elapsed:
        number = cellAs<int64_t>(cell);
        break;
      case Type::unsigned64:
        number = cell;
        break;
      case Type::real32:
        number = static_cast<double>(cellAs<float>(cell));
        break;
      case Type::real64:
        number = cellAs<double>(cell);
        break;
      default:
        return false;
    }
    const bool real = number.kind() == QVValue::Kind::real;
    const bool sentinel = real ? std::isnan(number.real()) : cell == kSentinel;
    if (!sentinel || (header_.flags & kSentinelFlag) == 0) value = number.integerValue();
    return true;
  }

  const std::string_view bytes_;
  const Header header_;
  QVChannelReadings& readings_;
  std::array<Table, 6> tables_;  // by kind
};

}  // namespace

int QVMMVFormat::parse(std::string_view bytes, QVChannelReadings& readings) {
  if (bytes.size() < sizeof(Header)) return EBADMSG;
  const auto header = elementAt<Header>(bytes, 0);
  if (header.magic != std::array<char, 4>{'M', 'M', 'V', '\0'}) return EBADMSG;
  if (header.version != kVersion) return ENOTSUP;
  // The second generation is written when everything else is; before, it is another one, or 0.
  if (header.generation == 0 || header.generation != header.generationAgain) return EAGAIN;
  return Parser(bytes, header, readings).run() ? 0 : EBADMSG;
}
