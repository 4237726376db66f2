#include "client/QVClientPayload.h"
#include "platform/QVValue.h"
#include "platform/linux/bus/QVBusProtocol.h"
#include "platform/linux/bus/QVBusReader.h"
#include "platform/linux/bus/QVBusValueDecoder.h"
#include "platform/linux/bus/QVBusWriter.h"

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

using Code = QVClientError::Code;

// The payload as the body of a message, whose rules are checked while it is read.
QVDictionary decoded(const QVClientPayload& payload) {
  EXPECT_TRUE(payload.ok()) << payload.error().text();
  std::string body;
  QVBusWriter writer(body);
  writer.writeNumber(static_cast<uint32_t>(payload.entries().size()));
  writer.writeNumber<uint32_t>(0);
  body.append(payload.entries());
  QVBusReader reader(body, false);
  QVBusValueDecoder decoder;
  QVDictionary dictionary = decoder.readDictionary(reader, nullptr);
  EXPECT_TRUE(reader.ok()) << reader.failure();
  EXPECT_TRUE(reader.atEnd());
  EXPECT_EQ(decoder.refusal(), nullptr);
  return dictionary;
}

TEST(QVClientPayload, IsEmptyAtFirst) {
  const QVClientPayload payload;
  EXPECT_TRUE(payload.ok());
  EXPECT_TRUE(decoded(payload).empty());
}

TEST(QVClientPayload, TakesEveryKindOfValue) {
  QVClientPayload payload;
  payload.set("yes", true).set("no", false);
  payload.set("int", 480).set("least", std::numeric_limits<int64_t>::min());
  payload.set("small", int8_t{-3}).set("byte", uint8_t{200}).set("unsigned", 7U);
  payload.set("most", std::numeric_limits<uint64_t>::max());
  payload.set("float", 1.5F).set("double", -0.25);
  payload.set("literal", "speaker").set("string", std::string("Über"));
  payload.set("view", std::string_view("x")).set("nothing", "");
  EXPECT_EQ(decoded(payload), (QVDictionary{{"yes", true},
                                            {"no", false},
                                            {"int", 480},
                                            {"least", std::numeric_limits<int64_t>::min()},
                                            {"small", -3},
                                            {"byte", 200},
                                            {"unsigned", 7},
                                            {"most", std::numeric_limits<uint64_t>::max()},
                                            {"float", 1.5},
                                            {"double", -0.25},
                                            {"literal", "speaker"},
                                            {"string", "Über"},
                                            {"view", "x"},
                                            {"nothing", ""}}));
}

TEST(QVClientPayload, KeepsNumbersThatAreNone) {
  QVClientPayload payload;
  payload.set("nan", std::nan("")).set("inf", std::numeric_limits<double>::infinity());
  const QVDictionary dictionary = decoded(payload);
  EXPECT_TRUE(std::isnan(dictionary.find("nan")->real()));
  EXPECT_TRUE(std::isinf(dictionary.find("inf")->real()));
}

TEST(QVClientPayload, NestsDictionariesAndArrays) {
  QVClientPayload payload;
  payload.beginDictionary("device").set("name", "pcm0").beginDictionary("jack").set("in", true);
  payload.endDictionary().set("rate", 48000).endDictionary();
  payload.beginArray("mixed").add(1).add("two").add(3.5).add(false);
  payload.beginArray().add(4).endArray();
  payload.beginDictionary().set("five", 5).endDictionary();
  payload.endArray().set("after", 6);
  EXPECT_EQ(
      decoded(payload),
      (QVDictionary{
          {"device",
           QVDictionary{{"name", "pcm0"}, {"jack", QVDictionary{{"in", true}}}, {"rate", 48000}}},
          {"mixed", QVArray{1, "two", 3.5, false, QVArray{4}, QVDictionary{{"five", 5}}}},
          {"after", 6}}));
}

TEST(QVClientPayload, TakesEmptyContainersAtEveryAlignment) {
  for (std::size_t length = 0; length < 9; ++length) {
    const std::string key(length, 'k');
    QVClientPayload payload;
    payload.beginDictionary(key + "d").endDictionary();
    payload.beginArray(key + "a").endArray();
    payload.set(key + "x", std::vector<int64_t>()).set(key + "z", 1);
    EXPECT_EQ(decoded(payload), (QVDictionary{{key + "d", QVDictionary(QVDictionary{})},
                                              {key + "a", QVArray()},
                                              {key + "x", QVArray()},
                                              {key + "z", 1}}))
        << length;
  }
}

TEST(QVClientPayload, TakesListsOfNumbersAtEveryAlignment) {
  const std::vector<int64_t> integers{1, -2, std::numeric_limits<int64_t>::max()};
  const std::vector<double> reals{0.5, -60};
  for (std::size_t length = 0; length < 9; ++length) {
    const std::string key(length, 'k');
    QVClientPayload payload;
    payload.set(key + "i", integers).set(key + "r", reals);
    payload.beginArray(key + "a").add(reals).add(integers).endArray();
    EXPECT_EQ(
        decoded(payload),
        (QVDictionary{{key + "i", QVArray{1, -2, std::numeric_limits<int64_t>::max()}},
                      {key + "r", QVArray{0.5, -60.0}},
                      {key + "a", QVArray{QVArray{0.5, -60.0},
                                          QVArray{1, -2, std::numeric_limits<int64_t>::max()}}}}))
        << length;
  }
}

TEST(QVClientPayload, OfEqualKeysTheLaterCounts) {
  QVClientPayload payload;
  payload.set("volume", 1).set("volume", 2);
  EXPECT_EQ(decoded(payload), (QVDictionary{{"volume", 2}}));
}

TEST(QVClientPayload, ClearingMakesItEmptyAndKeepsItsMemory) {
  QVClientPayload payload;
  payload.set("text", std::string(5000, 'x'));
  const char* memory = payload.entries().data();
  payload.clear();
  EXPECT_TRUE(decoded(payload).empty());
  payload.set("text", std::string(5000, 'y'));
  EXPECT_EQ(payload.entries().data(), memory);
  EXPECT_EQ(decoded(payload), (QVDictionary{{"text", std::string(5000, 'y')}}));
}

TEST(QVClientPayload, MovesWithItsOpenContainers) {
  QVClientPayload payload;
  payload.beginDictionary("outer").set("a", 1);
  QVClientPayload moved(std::move(payload));
  moved.set("b", 2).endDictionary();
  EXPECT_EQ(decoded(moved), (QVDictionary{{"outer", QVDictionary{{"a", 1}, {"b", 2}}}}));
}

TEST(QVClientPayload, WhatIsLeftOpenIsAnError) {
  QVClientPayload payload;
  payload.beginArray("levels").add(1);
  EXPECT_FALSE(payload.ok());
  EXPECT_EQ(payload.error().code(), Code::invalidPayload);
  payload.endArray();
  EXPECT_TRUE(payload.ok());
  EXPECT_FALSE(payload.error());
}

TEST(QVClientPayload, KeysBelongInDictionariesAndItemsInArrays) {
  QVClientPayload payload;
  payload.add(1);
  EXPECT_EQ(payload.error().code(), Code::invalidPayload);
  payload.clear();
  payload.beginArray("a").set("key", 1);
  EXPECT_EQ(payload.error().code(), Code::invalidPayload);
}

TEST(QVClientPayload, OnlyWhatIsOpenCanBeClosed) {
  QVClientPayload payload;
  payload.endDictionary();
  EXPECT_EQ(payload.error().code(), Code::invalidPayload);
  payload.clear();
  payload.beginArray("a").endDictionary();
  EXPECT_EQ(payload.error().code(), Code::invalidPayload);
}

TEST(QVClientPayload, RefusesWhatIsNoText) {
  for (const std::string& text : {std::string("\xff"), std::string("a\0b", 3),
                                  std::string("\xed\xa0\x80"), std::string("\xc0\x80")}) {
    QVClientPayload payload;
    payload.set("key", text);
    EXPECT_EQ(payload.error().code(), Code::invalidPayload);
    payload.clear();
    payload.set(text, 1);
    EXPECT_EQ(payload.error().code(), Code::invalidPayload);
  }
}

TEST(QVClientPayload, TheFirstErrorSticksUntilItIsCleared) {
  QVClientPayload payload;
  payload.set("good", 1).set("bad", "\xff").endArray().set("late", 2).beginDictionary("d");
  EXPECT_EQ(payload.error().text(), "a text of the payload is no UTF-8");
  payload.clear();
  payload.set("good", 1);
  EXPECT_EQ(decoded(payload), (QVDictionary{{"good", 1}}));
}

TEST(QVClientPayload, TakesAsManyDictionariesWithinEachOtherAsTheWireDoes) {
  QVClientPayload payload;
  for (int i = 0; i < 20; ++i) payload.beginDictionary("d");
  payload.set("deepest", std::vector<double>{1});
  for (int i = 0; i < 20; ++i) payload.endDictionary();
  EXPECT_EQ(decoded(payload).size(), 1U);

  payload.clear();
  for (int i = 0; i < 21; ++i) payload.beginDictionary("d");
  EXPECT_EQ(payload.error().text(), "the payload is nested too deeply");
}

TEST(QVClientPayload, TakesAsManyArraysWithinEachOtherAsTheWireDoes) {
  QVClientPayload payload;
  payload.beginArray("a");
  for (int i = 1; i < 30; ++i) payload.beginArray();
  payload.add(std::vector<double>{1});
  for (int i = 0; i < 30; ++i) payload.endArray();
  EXPECT_EQ(decoded(payload).size(), 1U);

  payload.clear();
  payload.beginArray("a");
  for (int i = 1; i < 31; ++i) payload.beginArray();
  EXPECT_EQ(payload.error().text(), "the payload is nested too deeply");
}

TEST(QVClientPayload, RefusesMoreThanAMessageMayHold) {
  QVClientPayload payload;
  const std::string megabyte(std::size_t{1} << 20, 'm');
  for (int i = 0; i < 7; ++i) payload.set("m", megabyte);
  EXPECT_TRUE(payload.ok());
  payload.set("m", megabyte);
  EXPECT_EQ(payload.error().code(), Code::messageTooLarge);
  EXPECT_LE(payload.entries().size(), kBusMaximumMessageBytes);
}

TEST(QVClientPayload, IsWrittenIntoTheMemoryGiven) {
  std::array<char, 128> memory{};
  QVClientPayload payload{std::span(memory)};
  payload.set("frames", 480).set("route", "speaker");
  EXPECT_EQ(payload.entries().data(), memory.data());
  EXPECT_EQ(decoded(payload), (QVDictionary{{"frames", 480}, {"route", "speaker"}}));
  for (int i = 0; payload.ok() && i < 10; ++i) payload.set("more", i);
  EXPECT_EQ(payload.errorCode(), Code::messageTooLarge);
  EXPECT_EQ(payload.entries().data(), memory.data());
  EXPECT_LE(payload.entries().size(), memory.size());
  payload.clear();
  EXPECT_EQ(payload.errorCode(), Code::none);
  payload.set("text", std::string(128, 'x'));
  EXPECT_EQ(payload.errorCode(), Code::messageTooLarge);
  payload.use(std::span<char>());
  payload.set("n", 1);
  EXPECT_EQ(payload.errorCode(), Code::messageTooLarge);
}

TEST(QVClientPayload, TakesEntriesThatAreThereAlready) {
  QVClientPayload written;
  written.set("frames", 480);
  std::string bytes(written.entries());
  QVClientPayload read;
  read.use(bytes, bytes.size());
  EXPECT_EQ(decoded(read), (QVDictionary{{"frames", 480}}));
}

TEST(QVClientPayload, RefusesALengthThatWouldWrapAround) {
  // Only the length is looked at: the bytes are not touched, since there is no room for them.
  const std::vector<double> one(1);
  QVClientPayload payload;
  payload.set("huge", std::span<const double>(one.data(), std::size_t{1} << 61));
  EXPECT_EQ(payload.error().code(), Code::messageTooLarge);
}

}  // namespace
