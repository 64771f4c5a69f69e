#include "host/shots/shot_list.h"

#include <gmock/gmock.h>

#include <cstdint>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace calmframe::host {
namespace {

using ::testing::HasSubstr;

// Numbers from SMPTE 12M: drop-frame time leaves out 2 (of 60: 4) numbers in every minute but each
// tenth, so that 107892 frames of 30000/1001 are an hour.
TEST(ShotListTest, TimeCodesKeepToTheClock) {
  const struct {
    std::int64_t num, den, frame;
    const char* code;
  } cases[] = {{25, 1, 74, "00:00:02:24"},           {25, 1, 25 * 3661, "01:01:01:00"},
               {24000, 1001, 24, "00:00:01:00"},     {50, 1, 49, "00:00:00:49"},
               {30000, 1001, 1799, "00:00:59;29"},   {30000, 1001, 1800, "00:01:00;02"},
               {30000, 1001, 3597, "00:01:59;29"},   {30000, 1001, 3598, "00:02:00;02"},
               {30000, 1001, 17981, "00:09:59;29"},  {30000, 1001, 17982, "00:10:00;00"},
               {30000, 1001, 107892, "01:00:00;00"}, {60000, 1001, 3600, "00:01:00;04"},
               {60000, 1001, 35964, "00:10:00;00"},  {30, 1, 1800, "00:01:00:00"}};
  for (const auto& c : cases) {
    const std::string edl = EdlOf({"walk.mov", c.num, c.den}, {{0, c.frame, 0, 0, "start"}});
    const bool drops = c.code[8] == ';';
    const std::string zero = drops ? "00:00:00;00" : "00:00:00:00";
    EXPECT_THAT(edl, HasSubstr("001  AX       V     C        " + zero + " " + c.code + " " + zero +
                               " " + c.code + "\n* FROM CLIP NAME: walk.mov\n"));
    EXPECT_THAT(edl, HasSubstr(drops ? "FCM: DROP FRAME\n" : "FCM: NON-DROP FRAME\n"));
  }
}

TEST(ShotListTest, NamesBreakNoForm) {
  const ListedFilm film{"a \"b\",\nc.mp4", 25, 1};
  const std::vector<ListedShot> shots = {{0, 50, 0, 2, "start"}, {50, 61, 2, 2.44, "dissolve"}};
  EXPECT_EQ(CsvOf(film, shots),
            "clip,shot,first_frame,end_frame,begins,ends,how\r\n"
            "\"a \"\"b\"\",\nc.mp4\",1,0,50,0.000,2.000,start\r\n"
            "\"a \"\"b\"\",\nc.mp4\",2,50,61,2.000,2.440,dissolve\r\n");
  // Not to be computed.
  EXPECT_THAT(CsvOf({"=1+1.mp4", 25, 1}, shots), HasSubstr("\r\n\"'=1+1.mp4\",1,"));
  EXPECT_THAT(EdlOf(film, shots), HasSubstr("TITLE: a \"b\",_c.mp4\nFCM"));
  EXPECT_EQ(JsonOf(film, shots)["shots"][1]["begins"], 2.0);
}

}  // namespace
}  // namespace calmframe::host
