#pragma once

#include "tests/unit/tally/QVTestBytes.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

// Types of metrics, as they are in a file.
enum QVTestMMVType : int32_t {
  kSigned32 = 0,
  kUnsigned32 = 1,
  kSigned64 = 2,
  kUnsigned64 = 3,
  kFloat = 4,
  kDouble = 5,
  kText = 6,
  kElapsed = 9
};

// A file of values put together by hand, field by field: right ones, and wrong ones by patching.
// The order of the sections is domain, instances, metrics, values, texts; those without elements
// are left out.
struct QVTestMMV {
  struct Metric {
    std::string name;
    std::vector<uint64_t> cells;  // one for each subgroup; one where the metric has none
    int32_t type = kUnsigned64;
    bool grouped = false;
  };

  static constexpr std::size_t kHeader = 40;
  static constexpr std::size_t kSection = 16;
  static constexpr std::size_t kDomain = 32;
  static constexpr std::size_t kInstance = 80;
  static constexpr std::size_t kMetric = 104;
  static constexpr std::size_t kValue = 32;
  static constexpr std::size_t kText = 256;

  std::vector<std::string> subgroups = {};
  std::vector<Metric> metrics = {};
  std::size_t texts = 0;
  int32_t version = 1;
  uint64_t generation = 7;
  uint32_t flags = 0;

  std::size_t values() const {
    std::size_t count = 0;
    for (const Metric& metric : metrics) count += metric.cells.size();
    return count;
  }
  std::size_t sections() const {
    return (subgroups.empty() ? 0 : 2) + (metrics.empty() ? 0 : 1) + (values() == 0 ? 0 : 1) +
           (texts == 0 ? 0 : 1);
  }
  // Where the first of a kind begins.
  std::size_t domainAt() const { return kHeader + sections() * kSection; }
  std::size_t instanceAt(std::size_t i = 0) const {
    return domainAt() + (subgroups.empty() ? 0 : kDomain) + i * kInstance;
  }
  std::size_t metricAt(std::size_t i = 0) const {
    return instanceAt(subgroups.size()) + i * kMetric;
  }
  std::size_t valueAt(std::size_t i = 0) const { return metricAt(metrics.size()) + i * kValue; }

  std::string bytes() const {
    std::string bytes(valueAt(values()) + texts * kText, '\0');
    bytes.replace(0, 3, "MMV");
    QVPatch(bytes, 4, version);
    QVPatch(bytes, 8, generation);
    QVPatch(bytes, 16, generation);
    QVPatch(bytes, 28, flags);
    if (!subgroups.empty()) list(bytes, 1, 1, domainAt());
    list(bytes, 2, subgroups.size(), instanceAt());
    list(bytes, 3, metrics.size(), metricAt());
    list(bytes, 4, values(), valueAt());
    list(bytes, 5, texts, valueAt(values()));
    if (!subgroups.empty()) QVPatch(bytes, domainAt(), uint32_t{5});  // its serial
    for (std::size_t i = 0; i < subgroups.size(); ++i) {
      QVPatch(bytes, instanceAt(i), uint64_t{domainAt()});
      bytes.replace(instanceAt(i) + 16, subgroups[i].size(), subgroups[i]);
    }
    std::size_t value = 0;
    for (std::size_t i = 0; i < metrics.size(); ++i) {
      bytes.replace(metricAt(i), metrics[i].name.size(), metrics[i].name);
      QVPatch(bytes, metricAt(i) + 68, metrics[i].type);
      QVPatch(bytes, metricAt(i) + 80, metrics[i].grouped ? uint32_t{5} : UINT32_MAX);
      for (std::size_t cell = 0; cell < metrics[i].cells.size(); ++cell, ++value) {
        QVPatch(bytes, valueAt(value), metrics[i].cells[cell]);
        QVPatch(bytes, valueAt(value) + 16, uint64_t{metricAt(i)});
        if (metrics[i].grouped) QVPatch(bytes, valueAt(value) + 24, uint64_t{instanceAt(cell)});
      }
    }
    return bytes;
  }

 private:
  static void list(std::string& bytes, int32_t kind, std::size_t count, std::size_t offset) {
    if (count == 0) return;
    int32_t known = 0;
    std::memcpy(&known, bytes.data() + 24, sizeof known);
    const std::size_t at = kHeader + static_cast<std::size_t>(known) * kSection;
    QVPatch(bytes, at, kind);
    QVPatch(bytes, at + 4, static_cast<int32_t>(count));
    QVPatch(bytes, at + 8, uint64_t{offset});
    QVPatch(bytes, 24, known + 1);
  }
};
