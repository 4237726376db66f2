#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "client/QVClientVocabulary.h"

#include <limits>

#include <gtest/gtest.h>

namespace {

TEST(QVClientVocabulary, ServiceTypesHaveTheNamesThatTheServiceGivesThem) {
  for (unsigned value = 0; value <= std::numeric_limits<uint16_t>::max(); ++value) {
    const auto number = static_cast<uint16_t>(value);
    EXPECT_EQ(QVClientNameOf(static_cast<QVClientServiceType>(number)),
              QVReportingServiceTypeName(number).value_or(""))
        << value;
  }
}

TEST(QVClientVocabulary, ServiceTypesAreFoundByTheirNames) {
  EXPECT_EQ(QVClientServiceTypeNamed("generic"), QVClientServiceType::generic);
  EXPECT_EQ(QVClientServiceTypeNamed("nonlongformaudio"), QVClientServiceType::nonlongformaudio);
  EXPECT_EQ(QVClientServiceTypeNamed("apiusage"), QVClientServiceType::apiusage);
  EXPECT_EQ(QVClientServiceTypeNamed("unknown"), QVClientServiceType::unknown);
}

TEST(QVClientVocabulary, ServiceTypesAreFoundByTheirNumbers) {
  EXPECT_EQ(QVClientServiceTypeNamed("7"), QVClientServiceType::longformaudio);
  EXPECT_EQ(QVClientServiceTypeNamed("4711"), static_cast<QVClientServiceType>(4711));
  EXPECT_EQ(QVClientServiceTypeNamed("65535"), QVClientServiceType::unknown);
}

TEST(QVClientVocabulary, WhatIsNeitherNameNorNumberIsNoServiceType) {
  for (const char* text : {"", "Telephony", "telephony ", "-1", "65536", "8x", "0x8"}) {
    EXPECT_EQ(QVClientServiceTypeNamed(text), std::nullopt) << text;
  }
}

TEST(QVClientVocabulary, CategoriesHaveTheNamesThatTheServiceGivesThem) {
  using Component = QVClientComponent;
  using Kind = QVClientKind;
  const auto name = [](QVClientCategory category) {
    return QVReportingCategoryName(category.word);
  };
  EXPECT_EQ(name({Component::session, Kind::playback}), "Session_Playback");
  EXPECT_EQ(name({Component::dsp, Kind::tallying}), "DSP_Tallying");
  EXPECT_EQ(name({Component::hal, Kind::undefined}), "HAL_Undefined");
  EXPECT_EQ(name({Component::routing, Kind::routeChange}), "Routing_RouteChange");
  EXPECT_EQ(name({Component::toolbox, Kind::error}), "Toolbox_Error");
  EXPECT_EQ(name(Kind::generic), "Generic");
  EXPECT_EQ(name(Kind::record), "Record");
  EXPECT_EQ(name(Kind::playbackAndRecord), "PlaybackAndRecord");
  EXPECT_EQ(name(Kind::setup), "Setup");
  EXPECT_EQ(name(Kind::clientRequest), "ClientRequest");
  EXPECT_EQ(name(Kind::performance), "Performance");
  EXPECT_EQ(name(Kind::volume), "Volume");
  EXPECT_EQ(name(QVClientCategory(0xFFFFFFFFU)), "Undefined");
}

TEST(QVClientVocabulary, MessageTypesHaveTheNamesThatTheServiceGivesThem) {
  using Type = QVClientMessageType;
  const auto name = [](Type type) {
    return QVReportingMessageTypeName(static_cast<uint16_t>(type));
  };
  EXPECT_EQ(name(Type::generic), "Generic");
  EXPECT_EQ(name(Type::start), "Start");
  EXPECT_EQ(name(Type::stop), "Stop");
  EXPECT_EQ(name(Type::setup), "Setup");
  EXPECT_EQ(name(Type::error), "Error");
  EXPECT_EQ(name(Type::issueDetector), "IssueDetector");
  EXPECT_EQ(name(Type::unknown), "Unknown");
}

}  // namespace
