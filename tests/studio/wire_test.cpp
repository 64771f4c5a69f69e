#include <stdexcept>

#include "studio/wire/encoding.h"
#include "studio/wire/message.h"
#include "studio/wire/settings.h"

namespace calmframe::studio {
namespace {

TEST(StudioWireTest, MessagesComeInAnyPieces) {
  const std::string bytes("\0\xff{}\n", 5);
  const std::string stream =
      Encode({{{"op", "frame"}, {"name", "a\xffz"}}, bytes}) + Encode({{{"id", 7}}, ""});
  for (std::size_t piece = 1; piece <= stream.size(); piece += 3) {
    MessageReader reader;
    std::vector<Message> read;
    for (std::size_t at = 0; at < stream.size(); at += piece) {
      reader.Add(stream.data() + at, std::min(piece, stream.size() - at));
      while (auto message = reader.Next()) read.push_back(*message);
    }
    ASSERT_EQ(read.size(), 2u) << piece;
    EXPECT_EQ(read[0].head["name"], "a\xEF\xBF\xBDz");
    EXPECT_EQ(read[0].bytes, bytes);
    EXPECT_EQ(read[1].head["id"], 7);
  }
}

TEST(StudioWireTest, RefusesWhatIsNoMessageBeforeItIsThere) {
  for (const std::string& stream :
       {std::string("\xff\xff\xff\xff\0\0\0\0", 8), std::string("\2\0\0\0\xff\xff\xff\xff{}", 10),
        std::string("\2\0\0\0\0\0\0\0[]", 10), std::string("\2\0\0\0\0\0\0\0{x", 10),
        std::string("\x46\x0d\x03\0\0\0\0\0{\"a\":", 13) + std::string(100000, '[') +
            std::string(100000, ']') + '}'}) {
    MessageReader reader;
    reader.Add(stream.data(), stream.size());
    EXPECT_THROW(reader.Next(), BadMessage);
  }
}

TEST(StudioWireTest, SettingsSurviveTheWayThereAndBack) {
  const nlohmann::json given = nlohmann::json::parse(
      R"({"controls": {"20": 80.5, "28": 2.0},
          "window": {"kind": "follow", "most_zoom": 1.2, "zoom_speed": 0.0, "still": "subject", "as_set": true},
          "deleted": [[3, 7], [12, 0]]})");
  EXPECT_EQ(JsonOf(SettingsOf(given)), given);
  const nlohmann::json none = {{"controls", nlohmann::json::object()},
                               {"window", nlohmann::json::object()}};
  EXPECT_EQ(JsonOf(SettingsOf(nlohmann::json::object())), none);
}

TEST(StudioWireTest, RefusesWhatNoEncoderCanBeToldOrWouldWriteElsewhere) {
  const nlohmann::json given = nlohmann::json::parse(
      R"({"crf": 23, "codec": "libvpx-vp9", "preset": "2", "options": ["row-mt=1", "x=a=b"], "overwrite": true})");
  EXPECT_EQ(JsonOf(EncodeSettingsOf(given)), given);
  EXPECT_EQ(EncodeSettingsOf({{"path", "out.mp4"}}).crf, 18);
  for (const char* text :
       {R"({"crf": 64})", R"({"crf": "18"})", R"({"codec": "../x"})", R"({"codec": 1})",
        R"({"preset": "a b"})", R"({"options": "g=1"})", R"({"options": ["g"]})",
        R"({"options": ["=1"]})", R"({"options": [1]})", R"({"options": ["stats=/tmp/x"]})",
        R"({"options": ["x264-params=stats=../x"]})"}) {
    EXPECT_THROW(EncodeSettingsOf(nlohmann::json::parse(text)), std::invalid_argument) << text;
  }
}

TEST(StudioWireTest, RefusesSettingsThatNobodyCanHaveMade) {
  for (const char* text :
       {"[]", R"({"controls": []})", R"({"controls": {"x": 1}})", R"({"controls": {"20x": 1}})",
        R"({"controls": {"20": "1"}})", R"({"controls": {"20": 1e300}})",
        R"({"controls": {"99999999999": 1}})", R"({"window": {"kind": "none"}})",
        R"({"window": {"most_zoom": 0}})", R"({"window": {"zoom_speed": -1}})",
        R"({"deleted": {}})", R"({"deleted": [[1]]})", R"({"deleted": [[1, -1]]})",
        R"({"deleted": [[1e10, 1]]})"}) {
    EXPECT_THROW(SettingsOf(nlohmann::json::parse(text)), std::invalid_argument) << text;
  }
}

}  // namespace
}  // namespace calmframe::studio
