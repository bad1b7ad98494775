// SPDX-License-Identifier: Apache-2.0
#include "plist/test_messages.h"

namespace PropertyList {
namespace {

struct Case {
  const char* name;
  std::string message;
  std::optional<Problem> problem = std::nullopt;
};

void check(const std::vector<Case>& cases) {
  for (const Case& c : cases) {
    EXPECT_EQ(problemIn(c.message), c.problem) << c.name;
  }
}

std::string withTrailer(std::size_t offsetSize, std::size_t referenceSize, std::uint64_t objects,
                        std::uint64_t top, std::uint64_t table) {
  return bytes("bplist00\x09\x08unused") + bigEndian(offsetSize, 1) + bigEndian(referenceSize, 1) +
         bigEndian(objects, 8) + bigEndian(top, 8) + bigEndian(table, 8);
}

TEST(Damage, Trailer) {
  check({{"sound", withTrailer(1, 1, 1, 0, 9)},
         {"empty", "", Problem::notPropertyList},
         {"only magic", "bplist00", Problem::truncated},
         {"other version", "bplist01" + withTrailer(1, 1, 1, 0, 9).substr(8),
          Problem::notPropertyList},
         {"offset size 0", withTrailer(0, 1, 1, 0, 9), Problem::trailer},
         {"offset size 9", withTrailer(9, 1, 1, 0, 9), Problem::trailer},
         {"reference size 0", withTrailer(1, 0, 1, 0, 9), Problem::trailer},
         {"reference size 9", withTrailer(1, 9, 1, 0, 9), Problem::trailer},
         {"no objects", withTrailer(1, 1, 0, 0, 9), Problem::trailer},
         {"top out of range", withTrailer(1, 1, 1, 1, 9), Problem::trailer},
         {"table over the trailer", withTrailer(1, 1, 1, 0, 10), Problem::trailer},
         {"table before the objects", withTrailer(1, 1, 1, 0, 7), Problem::trailer},
         {"table beyond the end", withTrailer(1, 1, 1, 0, ~0ull), Problem::trailer},
         {"overflowing table", withTrailer(8, 1, 0x2000'0000'0000'0001, 0, 9), Problem::trailer},
         {"object in the table", withTrailer(1, 1, 1, 0, 8), Problem::objectOutside}});
}

TEST(Damage, BinaryObjects) {
  check(
      {{"fill byte", binary({"\x0F"}), Problem::unknownMarker},
       {"marker 7", binary({"\x70"}), Problem::unknownMarker},
       {"marker B", binary({"\xB0"}), Problem::unknownMarker},
       {"32-byte integer", binary({"\x15" + std::string(32, '\0')}), Problem::unknownMarker},
       {"2-byte real", binary({bytes("\x21\0\0")}), Problem::unknownMarker},
       {"4-byte date", binary({bytes("\x32\0\0\0\0")}), Problem::unknownMarker},
       {"integer cut off", binary({bytes("\x13\0\0\0")}), Problem::objectOutside},
       {"string over the table", binary({"\x52y"}), Problem::objectOutside},
       {"count is a real", binary({bytes("\x5F\x22\0\0\0\0")}), Problem::badCount},
       {"count of 16 bytes", binary({"\x5F\x14" + std::string(16, '\0')}), Problem::badCount},
       {"8-byte count", binary({"\x5F\x13" + bigEndian(1, 8) + "x"})},
       {"vast string", binary({"\x5F\x13" + bigEndian(~0ull, 8)}), Problem::objectOutside},
       {"vast UTF-16", binary({"\x6F\x13" + bigEndian(1ull << 63, 8)}), Problem::objectOutside},
       {"vast dictionary", binary({"\xDF\x13" + bigEndian(1ull << 63, 8)}), Problem::objectOutside},
       {"not ASCII", binary({"\x52x\x80"}), Problem::notAscii},
       {"not ASCII, far in", binary({"\x5F\x10\x64" + std::string(99, 'x') + "\xFF"}),
        Problem::notAscii},
       {"lone low surrogate", binary({bytes("\x61\xDC\x00")}), Problem::straySurrogate},
       {"lone high surrogate", binary({bytes("\x62\xD8\x00\x00x")}), Problem::straySurrogate},
       {"high surrogate at the end", binary({bytes("\x61\xD8\x00")}), Problem::straySurrogate},
       {"date NaN", binary({"\x33\x7F\xF8" + std::string(6, '\0')}), Problem::dateNotFinite},
       {"date infinite", binary({"\x33\xFF\xF0" + std::string(6, '\0')}), Problem::dateNotFinite},
       {"reference out of range", binary({"\xA1\x01"}), Problem::referenceOutOfRange},
       {"key is an integer", binary({"\xD1\x01\x01", "\x10\x01"}), Problem::keyNotString},
       {"key is a container", binary({"\xD1\x01\x01", "\xA0"}), Problem::keyNotString},
       {"itself", binary({bytes("\xA1\x00")}), Problem::selfContaining},
       {"itself by a set", binary({"\xA1\x01", bytes("\xC1\x00")}), Problem::selfContaining},
       {"damage under an unread key",
        binary({"\xD2\x01\x02\x03\x04", "\x51\x61", "\x51\x62", "\x09", "\x51\x80"}),
        Problem::notAscii},
       {"damage in an object nobody references", binary({"\xA0", "\x51\x80"})}});
}

TEST(Damage, Objects8BytesWide) {
  const Raw wide{{"\xA1" + bigEndian(1, 8), "\x09"}, 8, 8};
  EXPECT_EQ(read(wide.message()), Tree(Array{true}));
  const Raw far{{"\xA1" + bigEndian((1ull << 63) + 1, 8), "\x09"}, 8, 8};
  EXPECT_EQ(problemIn(far.message()), Problem::referenceOutOfRange);
  for (std::size_t size = 1; size <= 8; ++size) {
    const Raw raw{{"\xA2" + bigEndian(2, size) + bigEndian(1, size), "\x09", "\x08"}, size, size};
    EXPECT_EQ(read(raw.message()), Tree(Array{false, true})) << size;
  }
}

const std::string sound = "<plist><true/></plist>";
const std::string type = "<!DOCTYPE plist PUBLIC \"-//Tessen//DTD PLIST 1.0//EN\" 'tessen.dtd'>";

void all(std::optional<Problem> problem, const std::vector<std::string>& messages) {
  for (const std::string& message : messages) EXPECT_EQ(problemIn(message), problem) << message;
}

TEST(Damage, XmlMarkup) {
  all(std::nullopt,
      {"\xEF\xBB\xBF" + sound, " \r\n\t" + sound + "\n",
       "<?xml version='1.0' encoding=\"utf-8\" standalone = 'no' ?>\n" + sound, type + sound,
       "<!DOCTYPE plist SYSTEM 'x'>" + sound, "<!DOCTYPE plist>" + sound,
       "<!-- a - b --><?x y?>" + type + "<!----><?z?>" + sound + "<!-- --> <?p?>",
       "<plist version='1.0' b=\"&lt;'\"><true a = '&#65;'/></plist >"});
  all(Problem::badInstruction, {" <?xml version='1.0'?>" + sound, xml("<?XmL?><true/>")});
  all(Problem::badDeclaration,
      {"<?xml version='1.0' encoding='UTF-16'?>" + sound, "<?xml encoding='UTF-8'?>" + sound,
       "<?xml version='1.0' standalone='no' encoding='UTF-8'?>" + sound,
       "<?xml version='2.0'?>" + sound});
  all(Problem::notPropertyList, {bytes("\xFE\xFF\0<\0p"), "plist"});
  all(Problem::badDocumentType, {"<!DOCTYPE plist [<!ENTITY a 'b'>]>" + sound});
  all(Problem::unknownElement, {type + type + sound, xml(type + "<true/>")});
  all(Problem::badComment, {xml("<!-- -- --><true/>"), xml("<!-- ---><true/>")});
}

TEST(Damage, XmlElements) {
  all(std::nullopt,
      {xml("<string>a</string\n>"), xml("<true></true>"), xml("<dict><key/><array/></dict>")});
  all(Problem::missingValue, {xml(""), "<plist/>", xml("<dict><key>a</key></dict>")});
  all(Problem::mismatchedEnd, {"<plist><true/>", xml("<true/><true/>"), xml("<string>a</key>"),
                               xml("<array><dict></array></dict>"), xml("<string>a</ string>")});
  all(Problem::strayText,
      {sound + "x", sound + sound, xml("<array>x<true/></array>"), xml("<array>&#32;</array>"),
       xml("<string>]]></string>"), xml("<true>1</true>"), xml("<false> </false>")});
  all(Problem::unknownElement,
      {"<list><true/></list>", xml("<array><![CDATA[ ]]></array>"), xml("<uid>1</uid>"),
       xml("<Dict/>"), xml(std::string(100'000, '<'))});
  all(Problem::misplacedElement,
      {xml("<string><b/></string>"), xml("<array><key>a</key></array>"),
       xml("<dict><true/></dict>"), xml("<dict><key>a</key><key>b</key></dict>")});
  all(Problem::badTag, {"<plist a='><true/></plist>", xml("<true a=b/>"), xml("<true a='<'/>"),
                        xml("<true a='1'b='2'/>")});
  all(Problem::duplicateAttribute, {xml("<true a='1' b='' a=\"2\"/>")});
  all(Problem::badInteger, {xml("<integer/>")});
  all(Problem::badReal, {xml("<real></real>")});
  all(Problem::badDate, {xml("<date/>")});
}

TEST(Damage, XmlCharacters) {
  const auto texts = [](std::optional<Problem> problem, const std::vector<std::string>& contents) {
    for (const std::string& text : contents) all(problem, {xml("<string>" + text + "</string>")});
  };
  texts(std::nullopt, {"\xF4\x8F\xBF\xBF&#x10FFFF;&#000000000000065;"});
  texts(Problem::forbiddenCharacter, {std::string(1, '\0'), "a\x1F", "\xEF\xBF\xBE"});
  // Overlong in two, three and four bytes; a surrogate; beyond U+10FFFF; alone; cut short.
  texts(Problem::badUtf8, {"\xC0\xAF", "\xE0\x80\xAF", "\xF0\x80\x80\xAF", "\xED\xA0\x80",
                           "\xF4\x90\x80\x80", "\x80", "\xE2\x82", "<![CDATA[\xC0]]>"});
  texts(Problem::badReference, {"&#0;", "&#xD800;", "&#xFFFF;", "&#x110000;",
                                "&#x10000000000000041;", "&#X41;", "&#;", "&nbsp;", "a & b"});
  all(Problem::forbiddenCharacter, {xml("<!--\x01--><true/>"), xml("<true a='\x02'/>")});
  all(Problem::badUtf8, {xml("<?a \xFF?><true/>")});
  all(Problem::badReference, {xml("<true a='&x;'/>")});
}

}  // namespace
}  // namespace PropertyList
