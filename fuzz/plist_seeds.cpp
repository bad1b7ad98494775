// SPDX-License-Identifier: Apache-2.0
// Makes the seeds in corpus/plist/: plist_seeds FOLDER
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "plist/writer.h"

using namespace PropertyList;

namespace {

std::vector<std::pair<std::string, Tree>> seeds() {
  Dictionary numbers;
  for (unsigned shift = 0; shift < 64; shift += 7) {
    numbers.emplace_back("u" + std::to_string(shift), ~std::uint64_t{0} >> shift);
    numbers.emplace_back("i" + std::to_string(shift), -(std::int64_t{1} << shift));
  }
  Array deep;
  for (int i = 0; i < 12; ++i) {
    Array outer;
    outer.emplace_back(std::move(deep));
    deep = std::move(outer);
  }
  return {
      {"message",
       Dictionary{{"c", 232}, {"client", "sample"}, {"date", Date{814'960'800}}, {"version", 1}}},
      {"numbers", numbers},
      {"reals", Array{0.0, -1.5, 1e300, 5e-324, std::numeric_limits<double>::infinity()}},
      {"texts", Array{"", "<&>\r\n", "caf\xC3\xA9", "\xF0\x9F\x98\x80", std::string(70, 'k')}},
      {"data", Array{Data{}, Data(1), Data(20), Data(100, std::byte{0xFF})}},
      {"deep", deep},
      {"keys", Dictionary{{"a", true},
                          {"b", false},
                          {std::string(80, 'x'), Array{}},
                          {std::string(79, 'x') + "y", Dictionary{}}}},
      {"null", nullptr},
      {"others", Array{nullptr, Uid{1}, Uid{1u << 20}, Set{{1, 2}}, Date{0.5}}}};
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 2) return std::fputs("usage: plist_seeds FOLDER\n", stderr), 2;
  const std::filesystem::path folder = arguments[1];
  std::filesystem::create_directories(folder / "binary");
  std::filesystem::create_directories(folder / "xml");
  for (const auto& [name, tree] : seeds()) {
    const std::vector<std::byte> message = writeBinary(tree);
    std::ofstream(folder / "binary" / name, std::ios::binary)
        .write(reinterpret_cast<const char*>(message.data()),
               static_cast<std::streamsize>(message.size()));
    try {
      std::ofstream(folder / "xml" / name, std::ios::binary) << writeXml(tree);
    } catch (const std::invalid_argument&) {
      std::filesystem::remove(folder / "xml" / name);
    }
  }
  return 0;
}
