#include "platform/tessel/config.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>

#include "platform/tessel/debug.h"

namespace tessel::config {
namespace {

TEST(LocalizerTest, KeyAndCommentAreCutAndEntitiesResolved) {
  EXPECT_EQ(Localizer::Localize("$$$/Plugin/Press=Click Analyze to begin."),
            "Click Analyze to begin.");
  EXPECT_EQ(
      Localizer::Localize("$$$/A=a = b#{cr}#{ldquo}c#{rdquo} #{copy} #{x}{{*COMMENT*}}#{cr}note"),
      "a = b\n\u201cc\u201d \u00a9 #{x}");
  EXPECT_EQ(Localizer::LocalizeUTF16("$$$/A=#{copy}"), u"\u00a9");
  EXPECT_EQ(Localizer::Localize("$$$/A="), "");
  for (const char* plain : {"", "a=b#{cr}", "$$$ no key=x", "$$$/NoText"}) {
    EXPECT_EQ(Localizer::Localize(plain), plain);
  }
}

TEST(LocalizerTest, TheTableComesFirstAndMayChangeUnderReaders) {
  std::thread reader([] {
    for (int i = 0; i < 2000; ++i) {
      const std::string text = Localizer::Localize("$$$/A/B=yes");
      EXPECT_TRUE(text == "yes" || text == "ja\n") << text;
    }
  });
  for (int i = 0; i < 200; ++i) {
    Localizer::SetTable({{"$$$/A/B", "ja#{cr}{{*COMMENT*}}x"}});
    EXPECT_EQ(Localizer::Localize("$$$/A/B=yes"), "ja\n");
    EXPECT_EQ(Localizer::Localize("$$$/A/C=no"), "no");
    Localizer::SetTable({});
  }
  reader.join();
}

TEST(StringTableTest, NumbersReservedPlacesAndTheEnd) {
  const char* const literals[] = {"$$$/0=About %d.%d#{cr}", "", "$$$/2=A|B", nullptr,
                                  "$$$/4=beyond"};
  const StringTable table(literals, 5);
  EXPECT_STREQ(table.Get(0), "About %d.%d\n");
  EXPECT_STREQ(table.Get(1), "");
  EXPECT_STREQ(table.Get(2), "A|B");
  for (const int bad : {-1, 3, 4, 5}) EXPECT_EQ(table.Get(bad), nullptr) << bad;
  EXPECT_EQ(StringTable(literals, 1).Get(1), nullptr);
}

TEST(ThrowErrorTest, TheErrorCarriesCodeAndTextAndIsTraced) {
  std::string traced;
  debug::SetSink([&](const std::string& line) { traced += line; });
  debug::DebugDatabase::Set("Trace.ThrowError", 1);
  try {
    ThrowError("$$$/E/Damaged=Saved data#{cr}is damaged.{{*COMMENT*}}x", 1273);
    FAIL();
  } catch (const Error& e) {
    EXPECT_STREQ(e.what(), "Saved data\nis damaged.");
    EXPECT_EQ(e.code(), 1273);
  }
  debug::DebugDatabase::Set("Trace.ThrowError", 0);
  debug::SetSink({});
  EXPECT_NE(traced.find("<ThrowError> <1> 1273 Saved data"), std::string::npos) << traced;
}

}  // namespace
}  // namespace tessel::config
