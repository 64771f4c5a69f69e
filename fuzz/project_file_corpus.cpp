// Writes a corpus for project_file_fuzz into a folder: files of saved work, told and as bytes.

#include <fstream>
#include <iterator>

#include "fuzz/saved_work_seeds.h"

int main(int argc, char** argv) {
  using namespace calmframe;
  const fuzz::SeedFolder folder(argc, argv);
  fuzz::AddSavedWork([&](const std::string& name, const std::string& input) {
    folder.Add(name, input);
    fuzz::Input told(reinterpret_cast<const std::uint8_t*>(input.data()), input.size());
    const fuzz::ScratchFile file;
    if (!fuzz::MakeSavedWork(told, file)) return;
    fuzz::RunSql(file.path(), "PRAGMA page_size = 512; VACUUM");
    std::ifstream bytes(file.path(), std::ios::binary);
    folder.Add(name + "_file", static_cast<char>(fuzz::WorkKind::bytes) +
                                   std::string{std::istreambuf_iterator<char>(bytes), {}});
  });
}
