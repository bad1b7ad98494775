// SPDX-License-Identifier: Apache-2.0
// A main for any harness: replays the files, and the files in the folders, that are its arguments.
// So the corpus runs as an ordinary test with any compiler. Fails when it finds nothing to replay.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace {

bool replay(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  const std::vector<char> bytes{std::istreambuf_iterator<char>(file), {}};
  if (!file) {
    std::fprintf(stderr, "%s: cannot be read\n", path.c_str());
    return false;
  }
  // A copy of exact size, so that a sanitizer sees a read past the end.
  const std::vector<std::uint8_t> input(bytes.begin(), bytes.end());
  LLVMFuzzerTestOneInput(input.data(), input.size());
  return true;
}

}  // namespace

int main(int count, char** arguments) {
  std::size_t replayed = 0;
  bool isSound = true;
  const auto add = [&](const std::filesystem::path& path) {
    isSound = replay(path) && isSound;
    ++replayed;
  };
  for (int i = 1; i < count; ++i) {
    if (std::filesystem::is_directory(arguments[i])) {
      for (const auto& entry : std::filesystem::recursive_directory_iterator(arguments[i])) {
        if (entry.is_regular_file()) add(entry.path());
      }
    } else {
      add(arguments[i]);
    }
  }
  std::printf("%zu inputs replayed\n", replayed);
  return isSound && replayed > 0 ? 0 : 1;
}
