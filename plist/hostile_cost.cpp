// SPDX-License-Identifier: Apache-2.0
/// Messages that are made to be expensive, and what each costs.
///
///   hostile_cost            every kind, 4 MB: nanoseconds and bytes of heap for a byte of message
///   hostile_cost --names    the names of all kinds
///   hostile_cost KIND SIZE  checks one message of about SIZE bytes, for whoever counts
///   instructions
#include "plist/test_messages.h"

#include <malloc.h>

#include <chrono>
#include <cstdio>
#include <functional>

namespace PropertyList {
namespace {

struct Kind {
  const char* name;
  std::function<std::string(std::size_t size)> make;
};

std::string repeated(std::string_view piece, std::size_t size) {
  std::string out;
  while (out.size() < size) out += piece;
  return out;
}

std::string listOf(std::size_t count) {
  return "\xAF\x12" + bigEndian(count, 4);
}

/// An XML dictionary of keys that `key` makes from a number.
std::string dictionary(std::size_t size, const std::function<std::string(std::size_t)>& key) {
  std::string out = "<dict>";
  for (std::size_t i = 0; out.size() < size; ++i) out += "<key>" + key(i) + "</key><true/>";
  return xml(out + "</dict>");
}

/// Keys of eight bytes of ASCII and of one hash, as often as there is room.
std::string collidingKeys(std::size_t size) {
  const std::vector<std::string> keys = keysOfOneHash(size / 22);
  Raw raw{{"\xDF\x12" + bigEndian(keys.size(), 4)}, 4, 4};
  for (std::size_t i = 0; i < keys.size(); ++i) raw.objects[0] += bigEndian(i + 2, 4);
  for (std::size_t i = 0; i < keys.size(); ++i) raw.objects[0] += bigEndian(1, 4);
  raw.objects.push_back("\x09");
  for (const std::string& key : keys) raw.objects.push_back("\x58" + key);
  return raw.message();
}

/// As many dictionaries as fit, all with the same two long keys.
std::string longSharedKeys(std::size_t size) {
  const std::size_t count = size / 2 / 17;
  Raw raw{{listOf(count)}, 4, 4};
  for (std::size_t i = 0; i < count; ++i) raw.objects[0] += bigEndian(i + 4, 4);
  for (const char last : {'a', 'b'}) {
    raw.objects.push_back("\x5F\x12" + bigEndian(size / 4, 4) + std::string(size / 4 - 1, 'k') +
                          last);
  }
  raw.objects.push_back("\x09");
  const std::string references =
      bigEndian(1, 4) + bigEndian(2, 4) + bigEndian(3, 4) + bigEndian(3, 4);
  for (std::size_t i = 0; i < count; ++i) raw.objects.push_back("\xD2" + references);
  return raw.message();
}

/// Levels of lists, each of which refers to every list of the next level.
std::string sharingGraph(std::size_t size) {
  constexpr std::size_t levels = 4;
  std::size_t width = 1;
  while (levels * width * width * 4 < size) ++width;
  Raw raw{{}, 4, 4};
  raw.objects.push_back("\xA1" + bigEndian(1, 4));
  for (std::size_t level = 0; level < levels; ++level) {
    for (std::size_t i = 0; i < width; ++i) {
      std::string list = listOf(width);
      for (std::size_t j = 1; j <= width; ++j) list += bigEndian(level * width + width + j, 4);
      raw.objects.push_back(level + 1 == levels ? "\x09" : list);
    }
  }
  return raw.message();
}

std::string onlyOffsets(std::size_t size) {
  Raw raw{std::vector<std::string>{"\xA1\x01", "\x09"}, 1, 1};
  const std::string objects = "bplist00\xA1\x01\x09";
  raw.objects.resize(size);
  return objects + "\x08\x0A" + std::string(size - 2, '\x0A') + raw.trailer(objects.size());
}

/// One text that every object claims.
std::string overlappingText(std::size_t size) {
  const std::size_t count = 3;
  std::string objects = "bplist00" + listOf(count);
  for (std::size_t i = 1; i <= count; ++i) objects += bigEndian(i, 2);
  const std::size_t text = objects.size();
  objects += "\x6F\x12" + bigEndian(size / 2, 4) + repeated({"\x20\xAC", 2}, size);
  std::string table = bigEndian(8, 4);
  for (std::size_t i = 1; i <= count; ++i) table += bigEndian(text, 4);
  return objects + table + Raw{std::vector<std::string>(count + 1), 2, 4}.trailer(objects.size());
}

std::string attributes(std::size_t size) {
  std::string tag = "<true";
  for (std::size_t i = 0; tag.size() < size; ++i) {
    tag += " a" + std::string(50, 'a') + std::to_string(i) + "=''";
  }
  return xml(tag + "/>");
}

std::string element(const std::string& name, const std::string& content) {
  return xml("<" + name + ">" + content + "</" + name + ">");
}

const std::vector<Kind>& kinds() {
  static const std::vector<Kind> all = {
      {"colliding-keys", collidingKeys},
      {"long-shared-keys", longSharedKeys},
      {"sharing-graph", sharingGraph},
      {"only-offsets", onlyOffsets},
      {"overlapping-text", overlappingText},
      {"attributes", attributes},
      {"short-keys",
       [](std::size_t size) {
         return dictionary(size, [](std::size_t i) { return std::to_string(i); });
       }},
      {"long-keys",
       [](std::size_t size) {
         return dictionary(
             size, [](std::size_t i) { return std::string(5000, 'k') + std::to_string(i); });
       }},
      {"booleans",
       [](std::size_t size) {
         return element("array", repeated("<true/>", size));
       }},
      {"nested",
       [](std::size_t size) {
         return element(
             "array", repeated(repeated("<array>", 7 * 500) + repeated("</array>", 8 * 500), size));
       }},
      {"entities",
       [](std::size_t size) {
         return element("string", repeated("&amp;", size));
       }},
      {"references",
       [](std::size_t size) {
         return element("string", repeated("&#00000000000065;", size));
       }},
      {"long-reference",
       [](std::size_t size) {
         return element("string", "&#" + repeated("0", size) + "65;");
       }},
      {"sections",
       [](std::size_t size) {
         return element("string", repeated("<![CDATA[]]>", size));
       }},
      {"comments",
       [](std::size_t size) {
         return element("array", repeated("<!--\xC3\xA9-->", size));
       }},
      {"line-ends",
       [](std::size_t size) {
         return element("string", repeated("\r", size));
       }},
      {"brackets",
       [](std::size_t size) {
         return element("string", repeated("]]", size));
       }},
      {"spaced-base64",
       [](std::size_t size) {
         return element("data", repeated("Q U\nJ\tD", size));
       }},
      {"long-integer",
       [](std::size_t size) {
         return element("integer", repeated("0", size));
       }},
      {"long-real",
       [](std::size_t size) {
         return element("real", "0." + repeated("123456789", size));
       }},
      {"reals",
       [](std::size_t size) {
         return element("array", repeated("<real>2.2250738585072011e-308</real>", size));
       }},
      {"late-fault",
       [](std::size_t size) {
         return element("array", repeated("\n", size) + "x");
       }},
  };
  return all;
}

/// The heap that the document takes, 0 where the message is refused.
std::size_t check(const std::string& message) {
  try {
    const Document document(bytesOf(message));
    const auto heap = mallinfo2();
    return heap.uordblks + heap.hblkhd;
  } catch (const MalformedDocument& error) {
    describe(error, bytesOf(message));
    return 0;
  }
}

void measure(const Kind& kind) {
  const std::string message = kind.make(std::size_t{4} << 20);
  const auto before = mallinfo2();
  const auto start = std::chrono::steady_clock::now();
  const std::size_t heap = check(message);
  const std::chrono::duration<double, std::nano> took = std::chrono::steady_clock::now() - start;
  const std::size_t own = heap == 0 ? 0 : heap - before.uordblks - before.hblkhd;
  const auto length = static_cast<double>(message.size());
  std::printf("%-18s %9zu bytes  %7.2f ns  %5.1f bytes of heap\n", kind.name, message.size(),
              took.count() / length, static_cast<double>(own) / length);
}

}  // namespace
}  // namespace PropertyList

int main(int argc, char** argv) {
  using namespace PropertyList;
  for (const Kind& kind : kinds()) {
    if (argc == 1) measure(kind);
    if (argc == 2) std::puts(kind.name);
    if (argc == 3 && std::string_view(argv[1]) == kind.name) check(kind.make(std::stoul(argv[2])));
  }
}
