// SPDX-License-Identifier: Apache-2.0
#include "plist/test_messages.h"

#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>

namespace PropertyList {
namespace {

/// A file of the corpus stands in a folder that says what is wrong with it.
TEST(Malformed, IsWhatTheCorpusSaysOfEachFile) {
  std::size_t files = 0;
  for (const char* encoding : {"binary", "xml"}) {
    const auto corpus = std::string(KEELGATE_CORPUS "/plist_") + encoding + "_fuzz/judged";
    for (const auto& entry : std::filesystem::recursive_directory_iterator(corpus)) {
      if (entry.is_directory()) continue;
      std::ifstream file(entry.path());
      const std::string message{std::istreambuf_iterator(file), {}};
      const std::optional<Problem> problem = problemIn(message);
      std::string told(problem ? reason(*problem) : "sound");
      std::ranges::replace_if(
          told, [](unsigned char c) { return std::isalnum(c) == 0; }, '-');
      EXPECT_EQ(told, entry.path().parent_path().filename()) << entry.path();
      ++files;
    }
  }
  EXPECT_GT(files, 200U);
}

std::string faultIn(std::string_view message) {
  try {
    read(message);
    return {};
  } catch (const MalformedDocument& error) {
    EXPECT_EQ(error.what(), reason(error.problem()));
    return describe(error, bytesOf(message));
  }
}

TEST(Malformed, SaysWhereAndWhatInOneSentence) {
  const std::string key = "<key>a</key>";
  const std::pair<std::string, std::string> cases[] = {
      {"", "byte 1: the message is empty"},
      {binary({"\xA1\x01", "\x70"}), "byte 11: an object has an unknown marker"},
      {binary({"\xD2\x01\x02\x03\x03", "\x51\x61", "\x51\x61", "\x09"}),
       "byte 11: a dictionary has the same key twice"},
      {"\n\n <x/>", "line 3, column 2: an element is unknown"},
      {xml("\r\n\r<integer>x</integer>"),
       "line 3, column 10: an integer is misspelt or does not fit 64 bits"},
      {xml("<string>\xC3\xA9\xFF</string>"), "line 1, column 18: the text is not valid UTF-8"},
      {xml("<dict>\n" + key + "<true/>\n" + key + "<true/></dict>"),
       "line 3, column 6: a dictionary has the same key twice"},
      {"<plist>\n<true/>", "line 2, column 8: the message ends too early"},
  };
  for (const auto& [message, expected] : cases) {
    EXPECT_EQ(faultIn(message), "Malformed property list at " + expected + ".") << message;
  }
}

}  // namespace
}  // namespace PropertyList
