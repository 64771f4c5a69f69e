#pragma once

#include <string_view>

namespace calmframe::studio {

// A file of the page, as it lies below page/; null where there is none.
struct PageFile {
  std::string_view path, bytes;
};
const PageFile* FindPageFile(std::string_view path);

}  // namespace calmframe::studio
