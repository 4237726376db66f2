// What a session's record is like after an allocation failed.

#include "QVServices/Statistics/Service/QVReportingPayloadStore.h"
#include "platform/QVText.h"
#include "tests/support/QVAllocationFailure.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>

namespace {

using Position = QVReportingPayloadStore::Position;

// Small ones first, while the first chunk is made; then new keys, texts and one of its own chunk.
std::vector<QVDictionary> messages() {
  std::vector<QVDictionary> messages;
  for (int number = 0; number < 5; ++number) messages.push_back({{"k", "small"}});
  for (int number = 0; number < 40; ++number) {
    messages.push_back({{QVText("key ", number % 3), number},
                        {"large", number == 20 ? std::string(100'000, 'z') : std::string()},
                        {"text", QVText("one of several texts: ", number % 7)}});
  }
  return messages;
}

// Once more where the first attempt failed: only one allocation does.
Position appendAtLast(QVReportingPayloadStore& store, const QVDictionary& message) {
  try {
    return store.append(message);
  } catch (const std::bad_alloc&) {
    return store.append(message);
  }
}

uint32_t internAtLast(QVReportingPayloadStore& store, std::string_view text) {
  try {
    return store.intern(text);
  } catch (const std::bad_alloc&) {
    return store.intern(text);
  }
}

TEST(QVReportingPayloadFailure, KeepsWhatWasRecordedWhicheverAllocationFailed) {
  // A chunk that was not needed after all.
  constexpr std::size_t kMostLeftBehind = 2000;
  const std::vector<QVDictionary> recorded = messages();
  QVReportingPayloadStore whole;
  for (const QVDictionary& message : recorded) whole.append(message);

  bool happened = true;
  for (std::size_t before = 0; happened; ++before) {
    QVReportingPayloadStore store;
    std::vector<Position> positions(recorded.size());
    std::vector<std::vector<QVDictionaryEntry>> rooms(recorded.size());
    for (auto& room : rooms) room.reserve(recorded.back().size());
    {
      const QVAllocationFailure failure(before);
      for (std::size_t i = 0; i < recorded.size(); ++i) {
        positions[i] = appendAtLast(store, recorded[i]);
        store.read(positions[i], rooms[i]);
      }
      happened = QVAllocationFailure::hasHappened();
    }
    std::vector<QVDictionaryEntry> again;
    for (std::size_t i = 0; i < recorded.size(); ++i) {
      store.read(positions[i], again);
      const QVDictionaryEntry& last = again.back();
      ASSERT_EQ(rooms[i].back().value.string().data(), last.value.string().data())
          << "it has moved while more came";
      EXPECT_EQ(QVDictionary::assemble(rooms[i]), recorded[i]) << before << ": " << i;
    }
    EXPECT_LE(store.footprint(), whole.footprint() + kMostLeftBehind) << before;
  }
}

TEST(QVReportingPayloadFailure, KeepsInternedTextsApartWhicheverAllocationFailed) {
  const std::vector<std::string> texts{"Session.Start", "Session.Stop", "Session.RouteChange"};
  bool happened = true;
  for (std::size_t before = 0; happened; ++before) {
    QVReportingPayloadStore store;
    std::array<uint32_t, 3> numbers{};
    {
      const QVAllocationFailure failure(before);
      for (std::size_t i = 0; i < texts.size(); ++i) numbers[i] = internAtLast(store, texts[i]);
      happened = QVAllocationFailure::hasHappened();
    }
    for (std::size_t i = 0; i < texts.size(); ++i) {
      EXPECT_EQ(store.interned(numbers[i]), texts[i]) << before;
    }
  }
}

}  // namespace
