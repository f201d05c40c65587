// Runs a target with files: each unchanged, or with --sweep STEP damaged at every STEPth position.
#include "Fuzz.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

namespace {

namespace fs = std::filesystem;

std::vector<fs::path> filesBelow(const fs::path& path) {
  if (fs::is_regular_file(path)) return {path};
  std::vector<fs::path> files;
  if (!fs::exists(path)) return files;
  for (const auto& entry : fs::recursive_directory_iterator(path)) {
    if (entry.is_regular_file()) files.push_back(entry.path());
  }
  std::ranges::sort(files);
  return files;
}

/// At every `step`th position: truncates; flips each bit, and all bits; and puts in a NUL and a '<'.
std::size_t sweep(const std::string& bytes, std::size_t step) {
  std::size_t inputs = 0;
  std::string damaged = bytes;
  for (std::size_t at = 0; at < bytes.size(); at += step) {
    kvr::fuzz::run(std::string_view(bytes).substr(0, at));
    const unsigned original = static_cast<unsigned char>(bytes[at]);
    const unsigned toLess = original ^ 0x3CU;
    for (const unsigned change : {1U, 2U, 4U, 8U, 16U, 32U, 64U, 128U, 255U, original, toLess}) {
      damaged[at] = static_cast<char>(original ^ change);
      kvr::fuzz::run(damaged);
    }
    damaged[at] = bytes[at];
    inputs += 12;
  }
  return inputs;
}

}  // namespace

int main(int argc, char** argv) {
  const std::size_t step = argc > 2 && std::string_view(argv[1]) == "--sweep" ? std::stoul(argv[2]) : 0;
  std::size_t files = 0;
  std::size_t inputs = 0;
  for (int argument = step > 0 ? 3 : 1; argument < argc; ++argument) {
    for (const auto& path : filesBelow(argv[argument])) {
      std::ifstream file(path, std::ios::binary);
      const std::string bytes(std::istreambuf_iterator<char>(file), {});
      std::fprintf(stderr, "%s\n", path.c_str());  // so that a failure can be assigned to its file
      kvr::fuzz::run(bytes);
      inputs += 1 + (step > 0 ? sweep(bytes, step) : 0);
      ++files;
    }
  }
  std::printf("%zu files, %zu inputs\n", files, inputs);
  return files > 0 ? 0 : 1;
}
