#include <stdexcept>

#include "studio/wire/encoding.h"
#include "studio/wire/message.h"
#include "studio/wire/settings.h"
#include "studio/wire/told.h"

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

// Each at its limit, and beyond: of a worker that a clip has taken over.
TEST(StudioWireTest, HearsAsMuchAsAPageCanShow) {
  const auto info = [](const char* name, const nlohmann::json& value) {
    nlohmann::json told = nlohmann::json::parse(
        R"({"width": 9, "height": 9, "shown_width": 9, "frames": 9, "rate": 25, "interlaced": false})");
    told[name] = value;
    return nlohmann::json{{"info", told}};
  };
  const auto settings = [](int controls, int deleted) {
    nlohmann::json told = {{"controls", nlohmann::json::object()},
                           {"deleted", nlohmann::json::array()}};
    for (int i = 0; i < controls; ++i) told["controls"][std::to_string(i)] = 1.0;
    for (int i = 0; i < deleted; ++i) told["deleted"].push_back({i, 0});
    return nlohmann::json{{"settings", told}};
  };
  const auto progress = [](double share) {
    return nlohmann::json{{"progress", {{"stage", "solving"}, {"says", ""}, {"share", share}}}};
  };
  const std::pair<nlohmann::json, nlohmann::json> table[] = {
      {{{"picture", 4294967295}}, {{"picture", 4294967296}}},
      {info("frames", 10000000), info("frames", 10000001)},
      {info("width", 1), info("width", 0)},
      {info("rate", 1e9), info("rate", 1.1e9)},
      {info("rate", 1e-9), info("rate", -1e-9)},
      {progress(1), progress(1.001)},
      {settings(500, 20000), settings(501, 0)},
      {settings(0, 20000), settings(0, 20001)}};
  for (const auto& [held, beyond] : table) {
    EXPECT_NO_THROW(ToldOf(held)) << held.dump().substr(0, 200);
    EXPECT_ANY_THROW(ToldOf(beyond)) << beyond.dump().substr(0, 200);
  }
  const auto count = [](const char* key, std::size_t of) {
    nlohmann::json list = nlohmann::json::array();
    for (std::size_t i = 0; i < of; ++i) {
      list.push_back(std::string(key) == "shots" ? nlohmann::json{{"first", i}, {"end", i}} : "w");
    }
    return ToldOf({{key, list}})[key].size();
  };
  EXPECT_EQ(count("shots", 10001), 10000u);
  EXPECT_EQ(count("warnings", 101), 100u);

  const auto picture = [](int width, int height) {
    const auto byte = [](int number) { return static_cast<char>(number); };
    return std::string("\xff\xd8\xff\xdb\0\3\0\xff\xc0\0\21\10", 12) + byte(height >> 8) +
           byte(height) + byte(width >> 8) + byte(width) + '\3';
  };
  const auto heard = [](const std::string& bytes) {
    return AnswerOf("frame", 640, {{{"why", ""}}, bytes}).bytes;
  };
  EXPECT_EQ(heard(picture(640, 16384)), picture(640, 16384));
  EXPECT_EQ(heard(picture(640, 16385)), "");
  EXPECT_THROW(heard(picture(641, 9)), BadMessage);
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
