// SPDX-License-Identifier: Apache-2.0
// Rewrites XML property lists as binary ones: make_binary FILE.xml...  ->  FILE.bplist beside each.
#include "plist/document.h"
#include "plist/tree.h"
#include "plist/writer.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

namespace {

using PropertyList::Tree;
using PropertyList::Type;
using PropertyList::Value;

Tree treeOf(const Value& value) {
  switch (value.type()) {
    case Type::boolean:
      return value.boolean();
    case Type::integer: {
      const PropertyList::Integer integer = value.integer();
      if (integer.negative) return static_cast<std::int64_t>(integer.bits);
      return integer.bits;
    }
    case Type::real:
      return value.real();
    case Type::date:
      return PropertyList::Date{value.date()};
    case Type::string:
      return value.string();
    case Type::data:
      return PropertyList::Data(value.data().begin(), value.data().end());
    case Type::array: {
      PropertyList::Array elements;
      for (const Value element : value.elements()) elements.push_back(treeOf(element));
      return elements;
    }
    case Type::dictionary: {
      PropertyList::Dictionary entries;
      for (const auto entry : value.entries()) {
        entries.emplace_back(std::string(entry.key), treeOf(entry.value));
      }
      return entries;
    }
    case Type::null:
    case Type::uid:
    case Type::set:
      break;
  }
  return nullptr;  // XML has none of the rest
}

void rewrite(std::filesystem::path path) {
  std::ifstream in(path, std::ios::binary);
  const std::string xml(std::istreambuf_iterator<char>(in), {});
  const PropertyList::Document document(std::as_bytes(std::span(xml)));
  const auto binary = PropertyList::writeBinary(treeOf(document.top()));
  std::ofstream out(path.replace_extension(".bplist"), std::ios::binary);
  out.write(reinterpret_cast<const char*>(binary.data()),
            static_cast<std::streamsize>(binary.size()));
}

}  // namespace

int main(int argc, char** argv) {
  for (int i = 1; i < argc; ++i) {
    try {
      rewrite(argv[i]);
    } catch (const std::exception& error) {
      std::fprintf(stderr, "%s: %s\n", argv[i], error.what());
      return 1;
    }
  }
  return 0;
}
