#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingReservedPayloadKeys.h"

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

TEST(QVReportingServiceTypeName, NamesEveryServiceType) {
  const std::vector<std::string_view> names{"generic",          "voxa",          "telephony",
                                            "haptics",          "alarms",        "standalone",
                                            "soundautoconfig",  "longformaudio", "nonlongformaudio",
                                            "audiodeviceusage", "alerts",        "test",
                                            "apiusage"};
  for (uint16_t type = 0; type < names.size(); ++type) {
    EXPECT_EQ(QVReportingServiceTypeName(type), names[type]) << type;
  }
  EXPECT_EQ(QVReportingServiceTypeName(65535), "unknown");
}

TEST(QVReportingServiceTypeName, HasNoNameForOtherServiceTypes) {
  for (const int type : {13, 14, 255, 256, 32768, 65534}) {
    EXPECT_EQ(QVReportingServiceTypeName(static_cast<uint16_t>(type)), std::nullopt) << type;
  }
}

TEST(QVReportingCategoryName, NamesKinds) {
  const std::vector<std::string> names{
      "Undefined",   "Generic",       "Record",      "Playback", "PlaybackAndRecord",
      "Setup",       "ClientRequest", "RouteChange", "Error",    "Tallying",
      "Performance", "Volume",        "Undefined"};
  for (uint32_t kind = 0; kind < names.size(); ++kind) {
    EXPECT_EQ(QVReportingCategoryName(kind), names[kind]) << kind;
  }
  EXPECT_EQ(QVReportingCategoryName(0x0000FFFF), "Undefined");
}

TEST(QVReportingCategoryName, PutsTheComponentInFront) {
  EXPECT_EQ(QVReportingCategoryName(0x08000003), "Session_Playback");
  EXPECT_EQ(QVReportingCategoryName(0x10000009), "DSP_Tallying");
  EXPECT_EQ(QVReportingCategoryName(0x20000000), "HAL_Undefined");
  EXPECT_EQ(QVReportingCategoryName(0x40000007), "Routing_RouteChange");
  EXPECT_EQ(QVReportingCategoryName(0x80000008), "Toolbox_Error");
  EXPECT_EQ(QVReportingCategoryName(0x80000000), "Toolbox_Undefined");
}

TEST(QVReportingCategoryName, BeginsWithAnUnderscoreWhereNoComponentMatches) {
  EXPECT_EQ(QVReportingCategoryName(0x00010000), "_Undefined");
  EXPECT_EQ(QVReportingCategoryName(0x00050002), "_Record");
  EXPECT_EQ(QVReportingCategoryName(0x18000001), "_Generic") << "two components at once";
  EXPECT_EQ(QVReportingCategoryName(0x08010001), "_Generic") << "a component and another bit";
  EXPECT_EQ(QVReportingCategoryName(0xFFFF0001), "_Generic");
  EXPECT_EQ(QVReportingCategoryName(0xFFFFFFFE), "_Undefined");
}

TEST(QVReportingCategoryName, DoesNotLookAtTheComponentOfTheSummaryCategory) {
  EXPECT_EQ(QVReportingCategoryName(0xFFFFFFFF), "Undefined");
}

TEST(QVReportingMessageTypeName, NamesEveryMessageType) {
  const std::vector<std::string_view> names{"Generic", "Start", "Stop",
                                            "Setup",   "Error", "IssueDetector"};
  for (uint16_t type = 0; type < names.size(); ++type) {
    EXPECT_EQ(QVReportingMessageTypeName(type), names[type]) << type;
  }
  EXPECT_EQ(QVReportingMessageTypeName(65535), "Unknown");
}

TEST(QVReportingMessageTypeName, IsUndefinedOutsideOfTheTable) {
  for (const int type : {6, 9, 255, 65534}) {
    EXPECT_EQ(QVReportingMessageTypeName(static_cast<uint16_t>(type)), "Undefined") << type;
  }
}

TEST(QVReportingHostApplicationID, IsWhatLiesUnderTheKey) {
  EXPECT_EQ(QVReportingHostApplicationID({{"HostApplicationDisplayID", "org.example.Player"}}),
            QVValue("org.example.Player"));
  EXPECT_EQ(QVReportingHostApplicationID({{"HostApplicationDisplayID", 12}}), QVValue(12));
}

TEST(QVReportingHostApplicationID, IsUnknownWithoutTheKey) {
  EXPECT_EQ(QVReportingHostApplicationID({{"HostApplication", "x"}}), QVValue("Unknown"));
  EXPECT_EQ(QVReportingHostApplicationID({}), QVValue("Unknown"));
  EXPECT_EQ(QVReportingHostApplicationID(QVDictionary()), QVValue("Unknown"));
}

TEST(QVReportingReservedPayloadKeys, KeepTheirOrder) {
  EXPECT_THAT(kQVReportingReservedPayloadKeys,
              ElementsAre("systemuptime_sec", "processuptime_ms", "qvreporting_timestamp",
                          "_comparison_field_blacklist", "_throttle_seconds"));
}

}  // namespace
