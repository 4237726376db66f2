#include "platform/fake/QVFakeDeviceInformation.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/settings/QVJSONDeviceInformation.h"
#include "tests/support/QVTemporaryRoot.h"

#include <limits>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kInternalBuild = "InternalBuild";
constexpr const char* kDeviceClass = "DeviceClassNumber";

class FakeDeviceInformationHarness {
 public:
  QVDeviceInformation& information() { return information_; }
  // Makes the device answer what this JSON object says.
  void setAnswers(const std::string& text) {
    QVJSONFailure failure;
    for (const char* key : {kInternalBuild, kDeviceClass}) information_.removeAnswer(key);
    const QVDictionary answers = QVJSONFile::parse(text, failure).value().dictionary();
    for (const auto& [key, value] : answers) information_.setAnswer(key, value);
  }

 private:
  QVFakeDeviceInformation information_;
};

class JSONDeviceInformationHarness {
 public:
  QVDeviceInformation& information() { return information_; }
  void setAnswers(const std::string& text) { root_.configure("device.json", text); }
  std::string path() const { return (root_.configuration() / "device.json").string(); }
  std::vector<std::string> lines() const { return log_.renderings(); }

 private:
  QVTemporaryRoot root_;
  QVFakeLog log_;
  QVJSONDeviceInformation information_{log_, path()};
};

template <class Harness>
class QVDeviceInformationContract : public testing::Test {
 protected:
  std::optional<bool> internalBuild(const std::string& value) {
    harness_.setAnswers("{\"InternalBuild\": " + value + "}");
    return harness_.information().booleanAnswer(kInternalBuild);
  }
  std::optional<int32_t> deviceClass(const std::string& value) {
    harness_.setAnswers("{\"DeviceClassNumber\": " + value + "}");
    return harness_.information().integerAnswer(kDeviceClass);
  }
  Harness harness_;
};

using Harnesses = testing::Types<FakeDeviceInformationHarness, JSONDeviceInformationHarness>;
TYPED_TEST_SUITE(QVDeviceInformationContract, Harnesses);

TYPED_TEST(QVDeviceInformationContract, HasNoAnswersAtFirst) {
  EXPECT_EQ(this->harness_.information().booleanAnswer(kInternalBuild), std::nullopt);
  EXPECT_EQ(this->harness_.information().integerAnswer(kDeviceClass), std::nullopt);
}

TYPED_TEST(QVDeviceInformationContract, ReadsBooleans) {
  for (const char* yes : {"true", "1", "-2", "0.5", R"("true")", R"("YES")", R"("1")"}) {
    EXPECT_EQ(this->internalBuild(yes), true) << yes;
  }
  for (const char* no : {"false", "0", "0.0", R"("on")", R"("")", "[]", "{}", "null"}) {
    EXPECT_EQ(this->internalBuild(no), false) << no;
  }
}

TYPED_TEST(QVDeviceInformationContract, ReadsIntegers) {
  EXPECT_EQ(this->deviceClass("6"), 6);
  EXPECT_EQ(this->deviceClass("-1"), -1);
  EXPECT_EQ(this->deviceClass("2.9"), 2);
  EXPECT_EQ(this->deviceClass("99999999999"), std::numeric_limits<int32_t>::max());
  EXPECT_EQ(this->deviceClass("-1e300"), std::numeric_limits<int32_t>::min());
  for (const char* none : {R"("6")", "[6]", "{}", "null"}) {
    EXPECT_EQ(this->deviceClass(none), std::nullopt) << none;
  }
}

TYPED_TEST(QVDeviceInformationContract, ShowsAChangeAtTheNextQuestion) {
  EXPECT_EQ(this->deviceClass("1"), 1);
  EXPECT_EQ(this->deviceClass("2"), 2);
  this->harness_.setAnswers("{}");
  EXPECT_EQ(this->harness_.information().integerAnswer(kDeviceClass), std::nullopt);
}

TEST(QVJSONDeviceInformationTest, SaysOnceWhereItsFileIsNoJSON) {
  JSONDeviceInformationHarness harness;
  EXPECT_EQ(harness.information().booleanAnswer(kInternalBuild), std::nullopt);
  EXPECT_THAT(harness.lines(), IsEmpty()) << "no file is no fault";
  harness.setAnswers("{\"InternalBuild\": true,}");
  EXPECT_EQ(harness.information().booleanAnswer(kInternalBuild), std::nullopt);
  EXPECT_EQ(harness.information().integerAnswer(kDeviceClass), std::nullopt);
  EXPECT_THAT(
      harness.lines(),
      ElementsAre("3[default] -[QVJSONDeviceInformation answers]: cannot read device"
                  " information " +
                  harness.path() + ": line 1, column 24: Missing a name for object member."));
}

}  // namespace
