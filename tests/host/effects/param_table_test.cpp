#include "host/effects/param_table.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

namespace calmframe::host {
namespace {

std::vector<HX_ParamDef> Declared() {
  std::vector<HX_ParamDef> params(6);
  params[1].kind = HX_PARAM_FLOAT_SLIDER;
  params[1].u.fs = {50, -1, 1000, 0, 100, 50, 0.05f, 1, 1};
  params[2].kind = HX_PARAM_POPUP;
  params[2].u.pd = {1, 1, 4, "a|b|c|d"};
  params[3].kind = HX_PARAM_CHECKBOX;
  params[4].kind = HX_PARAM_BUTTON;
  params[5].kind = HX_PARAM_FLOAT_SLIDER;
  params[5].u.fs = {0, 0, 2e9f, 0, 2000, 0, 0.05f, 0, 0};
  params[5].ui_flags = HX_PARAM_UI_HIDDEN;
  for (int i = 1; i < 6; ++i) params[i].disk_id = 30 + i;
  return params;
}

TEST(ParamTableTest, TheUsersValuesAreClamped) {
  ParamTable table(Declared());
  const struct {
    int index;
    double value, taken;
  } cases[] = {{1, 1e9, 1000}, {1, -1e9, -1}, {2, 0, 1}, {2, 7, 4},
               {2, 2.6, 3},    {3, 17, 1},    {3, 0, 0}, {1, 0.125, 0.125}};
  for (const auto& c : cases) {
    EXPECT_TRUE(table.SetByUser(c.index, c.value));
    EXPECT_EQ(*ValueOf(*table.At(c.index)), c.taken);
  }
  EXPECT_FALSE(table.SetByUser(1, std::nan("")));
  for (const int index : {-1, 0, 4, 6}) EXPECT_FALSE(table.SetByUser(index, 1));
  EXPECT_EQ(*ValueOf(*table.At(1)), 0.125);
}

TEST(ParamTableTest, ValuesGoByDiskId) {
  ParamTable table(Declared());
  table.SetValues({{32, 3}, {31, 2000}, {99, 1}});
  EXPECT_EQ(table.Values(), (ParamValues{{31, 1000}, {32, 3}, {33, 0}, {35, 0}}));
  EXPECT_EQ(table.IndexOf(35), 5);
  EXPECT_EQ(table.IndexOf(0), -1);
}

TEST(ParamTableTest, SettingsAreWhatTheUserCanSet) {
  ParamTable table(Declared());
  const std::string before = table.SettingsText();
  HX_ParamDef status = *table.At(5);
  status.u.fs.value = 9701;
  EXPECT_TRUE(table.SetByPlugin(5, status));
  EXPECT_EQ(table.SettingsText(), before);
  HX_ParamDef ui = *table.At(3);
  std::memset(ui.name, 'x', sizeof(ui.name));
  ui.ui_flags = HX_PARAM_UI_DISABLED;
  ui.u.bd.value = 1;
  EXPECT_TRUE(table.UpdateUI(3, ui));
  EXPECT_EQ(std::strlen(table.At(3)->name), 31u);
  EXPECT_EQ(*ValueOf(*table.At(3)), 0);
  EXPECT_EQ(table.SettingsText(), before);
  table.SetByUser(3, 1);
  EXPECT_NE(table.SettingsText(), before);
  table.SetByUser(3, 0);
  EXPECT_EQ(table.SettingsText(), before);
}

}  // namespace
}  // namespace calmframe::host
