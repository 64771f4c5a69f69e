#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>

// What the programs that write seeds share.
namespace calmframe::fuzz {

// The folder that such a program is given.
class SeedFolder {
 public:
  SeedFolder(int argc, char** argv) {
    if (argc != 2) {
      std::cerr << argv[0] << ": name the folder\n";
      std::exit(2);
    }
    folder_ = argv[1];
    std::filesystem::create_directories(folder_);
  }
  void Add(const std::string& name, const std::string& input) const {
    std::ofstream(folder_ / name, std::ios::binary) << input;
  }

 private:
  std::filesystem::path folder_;
};

template <class Record>
std::string BytesOf(const Record& record) {
  return std::string(reinterpret_cast<const char*>(&record), sizeof record);
}

}  // namespace calmframe::fuzz
