#include "tools/qvctl/QVToolFailure.h"
#include "tools/qvctl/QVTypedValue.h"

#include <cstdint>
#include <fstream>

#include <gtest/gtest.h>

namespace {

QVValue valueOf(const char* entry) {
  return QVTypedValue::parse(entry).value;
}

TEST(QVTypedValueTest, TakesValuesForWhatTheyLookLike) {
  EXPECT_EQ(valueOf("frames=480"), QVValue(480));
  EXPECT_EQ(valueOf("frames=-480"), QVValue(-480));
  EXPECT_EQ(valueOf("large=18446744073709551615"), QVValue(UINT64_MAX));
  EXPECT_EQ(valueOf("gain=1.5"), QVValue(1.5));
  EXPECT_EQ(valueOf("gain=1e3"), QVValue(1000.0));
  EXPECT_EQ(valueOf("flag=true"), QVValue(true));
  EXPECT_EQ(valueOf("flag=false"), QVValue(false));
  for (const char* word :
       {"speaker", "", "nan", "inf", "1.2.3", "0x10", "True", "{}", "5 dB", "-"}) {
    EXPECT_EQ(valueOf((std::string("route=") + word).c_str()), QVValue(word)) << word;
  }
}

TEST(QVTypedValueTest, TakesValuesOfTheKindThatIsGiven) {
  EXPECT_EQ(valueOf("a:int=5"), QVValue(5));
  EXPECT_EQ(valueOf("a:uint=18446744073709551615"), QVValue(UINT64_MAX));
  EXPECT_EQ(valueOf("a:double=1"), QVValue(1.0));
  EXPECT_EQ(valueOf("a:bool=1"), QVValue(true));
  EXPECT_EQ(valueOf("a:bool=no"), QVValue(false));
  EXPECT_EQ(valueOf("a:string=5"), QVValue("5"));
  EXPECT_EQ(valueOf(R"(a:json={"b":[1,2.0,"x"]})"),
            QVValue(QVDictionary{{"b", QVArray{1, 2.0, "x"}}}));
}

TEST(QVTypedValueTest, DividesAtTheFirstEqualsSign) {
  const auto typed = QVTypedValue::parse("a b:string=c=d:e");
  EXPECT_EQ(typed.key, "a b");
  EXPECT_EQ(typed.value, QVValue("c=d:e"));
}

TEST(QVTypedValueTest, RefusesWhatIsNoEntry) {
  for (const char* entry : {"frames", "=5", ":int=5", "a:int=x", "a:int=1.5", "a:uint=-1",
                            "a:bool=2", "a:double=", "a:json={", "a:float=1", "a:int="}) {
    try {
      QVTypedValue::parse(entry);
      ADD_FAILURE() << entry;
    } catch (const QVToolFailure& failure) {
      EXPECT_EQ(failure.status(), QVToolStatus::wrongUsage);
      EXPECT_NE(std::string(failure.what()).find(entry), std::string::npos) << failure.what();
    }
  }
}

// The bytes of a payload that was put together by hand.
std::string bytesOf(const QVClientPayload& payload) {
  return std::string(payload.entries());
}

TEST(QVTypedValueTest, MakesThePayloadThatTheLibraryWouldMake) {
  QVClientPayload expected;
  expected.set("frames", 480).set("gain", 1.5).set("on", true).set("route", "speaker");
  expected.beginDictionary("device").beginArray("list").add(1).add("x").beginArray().endArray();
  expected.endArray().endDictionary();
  EXPECT_EQ(bytesOf(QVMakePayload(QVPayloadOf::message, "",
                                  {"frames=480", "gain=1.5", "on=true", "route=speaker",
                                   R"(device:json={"list":[1,"x",[]]})"})),
            bytesOf(expected));
}

TEST(QVTypedValueTest, PutsEntriesBehindTheObject) {
  QVClientPayload expected;
  expected.set("a", 1).set("b", 2).set("a", 3);
  EXPECT_EQ(bytesOf(QVMakePayload(QVPayloadOf::message, R"({"b":2,"a":1})", {"a=3"})),
            bytesOf(expected));
}

TEST(QVTypedValueTest, ReadsTheObjectFromAFile) {
  const std::string path = testing::TempDir() + "/qv-typed-value.json";
  std::ofstream(path) << R"({"b":2})";
  QVClientPayload expected;
  expected.set("b", 2);
  EXPECT_EQ(bytesOf(QVMakePayload(QVPayloadOf::message, "@" + path, {})), bytesOf(expected));
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, "@" + path + ".missing", {}), QVToolFailure);
}

TEST(QVTypedValueTest, RefusesWhatCannotBeSent) {
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, "[1]", {}), QVToolFailure);
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, R"({"a":null})", {}), QVToolFailure);
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, "{", {}), QVToolFailure);
  const std::string deep = std::string(40, '[') + std::string(40, ']');
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, "", {"a:json=" + deep}), QVToolFailure);
  EXPECT_THROW(QVMakePayload(QVPayloadOf::message, "", {"a=\xFF"}), QVToolFailure);
}

TEST(QVTypedValueTest, SaysWhatCannotBeSent) {
  const auto complaint = [](QVPayloadOf use, const char* json, const char* entry) {
    try {
      QVMakePayload(
          use, json,
          entry == nullptr ? std::vector<std::string>() : std::vector{std::string(entry)});
    } catch (const QVToolFailure& failure) {
      return std::string(failure.what());
    }
    return std::string();
  };
  EXPECT_EQ(complaint(QVPayloadOf::message, "", "a:json=null"), "a: there is no null in messages");
  EXPECT_EQ(complaint(QVPayloadOf::message, "", R"(a:json=[1,{"b":[null]}])"),
            "a[1].b[0]: there is no null in messages");
  EXPECT_EQ(complaint(QVPayloadOf::configuration, R"({"a":{"b":1,"c":null}})", nullptr),
            "a.c: there is no null in configurations");
  EXPECT_EQ(complaint(QVPayloadOf::message, "[]", nullptr), "the payload: no JSON object");
  EXPECT_EQ(complaint(QVPayloadOf::configuration, "[]", nullptr),
            "the configuration: no JSON object");
  EXPECT_EQ(complaint(QVPayloadOf::configuration, "", "a=\xFF"),
            "a=\xFF: a text of the configuration is no UTF-8");
  const std::string deep = R"({"a":)" + std::string(40, '[') + std::string(40, ']') + "}";
  EXPECT_EQ(complaint(QVPayloadOf::configuration, deep.c_str(), nullptr),
            "the configuration is nested too deeply");
}

}  // namespace
