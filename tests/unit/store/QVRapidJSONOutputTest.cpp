#include "platform/linux/files/QVJSONFile.h"
#include "platform/linux/output/QVRapidJSONOutput.h"

#include <algorithm>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

constexpr std::size_t kPieceBytes = 65536;

class QVRapidJSONOutputTest : public testing::Test {
 protected:
  std::string text() const {
    std::string all;
    for (const std::string& piece : pieces_) all += piece;
    return all;
  }
  std::unique_ptr<QVJSONArrayStream> makeStream() {
    pieces_.clear();
    return QVRapidJSONOutput().makeArrayStream(
        [this](std::string_view piece) { pieces_.emplace_back(piece); });
  }

  std::vector<std::string> pieces_;
};

TEST_F(QVRapidJSONOutputTest, HandsOnWhatItHasInPiecesOfOneSize) {
  const auto stream = makeStream();
  ASSERT_EQ(stream->append(QVDictionary{{"small", 1}}), std::nullopt);
  EXPECT_TRUE(pieces_.empty());
  ASSERT_EQ(stream->append(QVDictionary{{"large", std::string(10 * kPieceBytes, 'x')}}),
            std::nullopt);
  EXPECT_EQ(pieces_.size(), 10u) << "before the end";
  stream->end();
  ASSERT_EQ(pieces_.size(), 11u);
  EXPECT_TRUE(std::all_of(pieces_.begin(), pieces_.end() - 1,
                          [](const std::string& piece) { return piece.size() == kPieceBytes; }));
}

// Whatever is being written when a piece is full: a string, an escape, an indentation, a number.
TEST_F(QVRapidJSONOutputTest, LosesNothingWhereAPieceEnds) {
  const QVDictionary element{{"a \"b\"", "\xFFtext\n"},
                             {"deep", QVDictionary{{"deeper", QVDictionary{{"n", -12.5}}}}},
                             {"list", QVArray{true, QVValue(), 1234567890123}}};
  for (std::size_t size = kPieceBytes - 250; size < kPieceBytes + 10; ++size) {
    const QVDictionary first{{"x", std::string(size, 'x')}};
    const auto stream = makeStream();
    ASSERT_EQ(stream->append(first), std::nullopt);
    ASSERT_EQ(stream->append(element), std::nullopt);
    stream->end();
    QVJSONFailure failure;
    const auto read = QVJSONFile::parse(text(), failure);
    ASSERT_TRUE(read.has_value()) << failure.description();
    ASSERT_EQ(read->array()[0], QVValue(first));
    ASSERT_EQ(*read->array()[1].dictionary().find("a \"b\""), QVValue("\xEF\xBF\xBDtext\n"));
    ASSERT_EQ(*read->array()[1].dictionary().find("deep"), *element.find("deep"));
    ASSERT_EQ(*read->array()[1].dictionary().find("list"), *element.find("list"));
  }
}

}  // namespace
