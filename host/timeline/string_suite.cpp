#include <string>

#include "host/timeline/media_core.h"
#include "platform/tessel/utility.h"

namespace calmframe::host {
namespace {

using Tables = MediaTables;

HX_Err MakeFromUTF8(const char* text, HX_String* string) {
  return Operation("String.MakeFromUTF8", [=](Tables& tables) {
    if (!text || !string) return HX_ERR_UNKNOWN;
    *string = tables.strings.Make(text);
    return HX_ERR_NONE;
  });
}

HX_Err MakeFromUTF16(const uint16_t* text, HX_String* string) {
  return Operation("String.MakeFromUTF16", [=](Tables& tables) {
    if (!text || !string) return HX_ERR_UNKNOWN;
    std::u16string units;
    for (const std::uint16_t* unit = text; *unit != 0; ++unit) {
      units.push_back(static_cast<char16_t>(*unit));
    }
    *string = tables.strings.Make(tessel::utility::ToUTF8(units));
    return HX_ERR_NONE;
  });
}

HX_Err GetUTF8(HX_String string, const char** text) {
  return Operation("String.GetUTF8", [=](Tables& tables) {
    const HX_StringRecord* const found = tables.strings.Find(string);
    if (!found || !text) return HX_ERR_UNKNOWN;
    *text = found->utf8.c_str();
    return HX_ERR_NONE;
  });
}

HX_Err GetUTF16(HX_String string, const uint16_t** text) {
  return Operation("String.GetUTF16", [=](Tables& tables) {
    const HX_StringRecord* const found = tables.strings.Find(string);
    if (!found || !text) return HX_ERR_UNKNOWN;
    *text = found->utf16.data();
    return HX_ERR_NONE;
  });
}

HX_Err Dispose(HX_String string) {
  return GivingBack("String.Dispose",
                    [=](Tables& tables) { return tables.strings.Dispose(string); });
}

HX_Err GetFileName(HX_String path, HX_String* name) {
  return Operation("String.GetFileName", [=](Tables& tables) {
    const HX_StringRecord* const found = tables.strings.Find(path);
    if (!found || !name) return HX_ERR_UNKNOWN;
    *name = tables.strings.Make(found->utf8.substr(found->utf8.rfind('/') + 1));
    return HX_ERR_NONE;
  });
}

}  // namespace

const HX_StringSuite1& StringSuiteTable() {
  static const HX_StringSuite1 table = {MakeFromUTF8, MakeFromUTF16, GetUTF8,
                                        GetUTF16,     Dispose,       GetFileName};
  return table;
}

}  // namespace calmframe::host
