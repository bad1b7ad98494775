// SPDX-License-Identifier: Apache-2.0
#include "plist/test_messages.h"
#include "plist/writer.h"

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

TEST(Damage, XmlMarkup) {
  const std::string sound = "<plist><true/></plist>";
  const std::string type = "<!DOCTYPE plist PUBLIC \"-//Tessen//DTD PLIST 1.0//EN\" 'tessen.dtd'>";
  check({
      {"byte order mark", "\xEF\xBB\xBF" + sound},
      {"white space before", " \r\n\t" + sound + "\n"},
      {"declaration", "<?xml version='1.0' encoding=\"utf-8\" standalone = 'no' ?>\n" + sound},
      {"document type", type + sound},
      {"system document type", "<!DOCTYPE plist SYSTEM 'x'>" + sound},
      {"bare document type", "<!DOCTYPE plist>" + sound},
      {"around", "<!-- a - b --><?x y?>" + type + "<!----><?z?>" + sound + "<!-- --> <?p?>"},
      {"attributes", "<plist version='1.0' b=\"&lt;'\"><true a = '&#65;'/></plist >"},
      {"space before declaration", " <?xml version='1.0'?>" + sound, Problem::badInstruction},
      {"other encoding", "<?xml version='1.0' encoding='UTF-16'?>" + sound,
       Problem::badDeclaration},
      {"no version", "<?xml encoding='UTF-8'?>" + sound, Problem::badDeclaration},
      {"declaration's order", "<?xml version='1.0' standalone='no' encoding='UTF-8'?>" + sound,
       Problem::badDeclaration},
      {"version 2", "<?xml version='2.0'?>" + sound, Problem::badDeclaration},
      {"UTF-16", bytes("\xFE\xFF\0<\0p"), Problem::notPropertyList},
      {"internal subset", "<!DOCTYPE plist [<!ENTITY a 'b'>]>" + sound, Problem::badDocumentType},
      {"document type twice", type + type + sound, Problem::unknownElement},
      {"document type inside", "<plist>" + type + "<true/></plist>", Problem::unknownElement},
      {"other root", "<list><true/></list>", Problem::unknownElement},
      {"no text at all", "plist", Problem::notPropertyList},
  });
}

TEST(Damage, XmlElements) {
  const std::string sound = "<plist><true/></plist>";
  check({
      {"nothing in it", xml(""), Problem::missingValue},
      {"empty root", "<plist/>", Problem::missingValue},
      {"two values", xml("<true/><true/>"), Problem::mismatchedEnd},
      {"text after", sound + "x", Problem::strayText},
      {"second root", sound + sound, Problem::strayText},
      {"cut off", "<plist><true/>", Problem::mismatchedEnd},
      {"text between", xml("<array>x<true/></array>"), Problem::strayText},
      {"reference between", xml("<array>&#32;</array>"), Problem::strayText},
      {"section between", xml("<array><![CDATA[ ]]></array>"), Problem::unknownElement},
      {"unknown element", xml("<uid>1</uid>"), Problem::unknownElement},
      {"upper case", xml("<Dict/>"), Problem::unknownElement},
      {"nested text", xml("<string><b/></string>"), Problem::misplacedElement},
      {"wrong end", xml("<string>a</key>"), Problem::mismatchedEnd},
      {"crossed ends", xml("<array><dict></array></dict>"), Problem::mismatchedEnd},
      {"space in the end tag", xml("<string>a</string\n>")},
      {"space before the end's name", xml("<string>a</ string>"), Problem::mismatchedEnd},
  });
}

TEST(Damage, XmlTags) {
  check({
      {"open quote", "<plist a='><true/></plist>", Problem::badTag},
      {"no quote", xml("<true a=b/>"), Problem::badTag},
      {"'<' in an attribute", xml("<true a='<'/>"), Problem::badTag},
      {"attributes run together", xml("<true a='1'b='2'/>"), Problem::badTag},
      {"attribute twice", xml("<true a='1' b='' a=\"2\"/>"), Problem::duplicateAttribute},
      {"unknown entity in an attribute", xml("<true a='&x;'/>"), Problem::badReference},
      {"dashes in a comment", xml("<!-- -- --><true/>"), Problem::badComment},
      {"comment's end", xml("<!-- ---><true/>"), Problem::badComment},
      {"instruction named XML", xml("<?XmL?><true/>"), Problem::badInstruction},
      {"end of a section in text", xml("<string>]]></string>"), Problem::strayText},
      {"key in an array", xml("<array><key>a</key></array>"), Problem::misplacedElement},
      {"value without key", xml("<dict><true/></dict>"), Problem::misplacedElement},
      {"two keys", xml("<dict><key>a</key><key>b</key></dict>"), Problem::misplacedElement},
      {"key without value", xml("<dict><key>a</key></dict>"), Problem::missingValue},
      {"text in true", xml("<true>1</true>"), Problem::strayText},
      {"space in false", xml("<false> </false>"), Problem::strayText},
      {"true in two tags", xml("<true></true>")},
      {"empty key", xml("<dict><key/><array/></dict>")},
      {"empty integer", xml("<integer/>"), Problem::badInteger},
      {"empty real", xml("<real></real>"), Problem::badReal},
      {"empty date", xml("<date/>"), Problem::badDate},
  });
}

TEST(Damage, XmlCharacters) {
  const auto text = [](const std::string& content) {
    return xml("<string>" + content + "</string>");
  };
  check({
      {"largest", text("\xF4\x8F\xBF\xBF&#x10FFFF;&#000000000000065;")},
      {"zero", text(std::string(1, '\0')), Problem::forbiddenCharacter},
      {"control", text("a\x1F"), Problem::forbiddenCharacter},
      {"U+FFFE", text("\xEF\xBF\xBE"), Problem::forbiddenCharacter},
      {"in a comment", xml("<!--\x01--><true/>"), Problem::forbiddenCharacter},
      {"in an instruction", xml("<?a \xFF?><true/>"), Problem::badUtf8},
      {"in an attribute", xml("<true a='\x02'/>"), Problem::forbiddenCharacter},
      {"in a section", text("<![CDATA[\xC0]]>"), Problem::badUtf8},
      {"overlong", text("\xC0\xAF"), Problem::badUtf8},
      {"overlong in 3", text("\xE0\x80\xAF"), Problem::badUtf8},
      {"overlong in 4", text("\xF0\x80\x80\xAF"), Problem::badUtf8},
      {"surrogate", text("\xED\xA0\x80"), Problem::badUtf8},
      {"beyond U+10FFFF", text("\xF4\x90\x80\x80"), Problem::badUtf8},
      {"lone continuation", text("\x80"), Problem::badUtf8},
      {"cut short", text("\xE2\x82"), Problem::badUtf8},
      {"reference to zero", text("&#0;"), Problem::badReference},
      {"reference to a surrogate", text("&#xD800;"), Problem::badReference},
      {"reference to U+FFFF", text("&#xFFFF;"), Problem::badReference},
      {"reference beyond", text("&#x110000;"), Problem::badReference},
      {"reference that overflows", text("&#x10000000000000041;"), Problem::badReference},
      {"upper-case X", text("&#X41;"), Problem::badReference},
      {"empty reference", text("&#;"), Problem::badReference},
      {"unknown entity", text("&nbsp;"), Problem::badReference},
      {"bare ampersand", text("a & b"), Problem::badReference},
  });
}

// No byte of these messages can be lost or changed so that reading does anything but accept or
// refuse; the sanitizers watch the rest.
TEST(Damage, EveryTruncationAndEveryChange) {
  const Tree tree = Dictionary{{"a", 1}, {"\xC3\xA9", Array{2.5, "x<", Data(5)}}, {"c", Date{0}}};
  const std::vector<std::byte> packed = writeBinary(tree);
  const std::string text = writeXml(tree);
  const std::string_view binary(reinterpret_cast<const char*>(packed.data()), packed.size());
  for (const std::string_view whole : {binary, std::string_view(text)}) {
    EXPECT_EQ(read(whole), tree);
    for (std::size_t length = 0; length + 1 < whole.size(); ++length) {
      // A copy of exact size, so that a read past the end is seen.
      const std::vector<char> cut(whole.begin(),
                                  whole.begin() + static_cast<std::ptrdiff_t>(length));
      EXPECT_NE(problemIn({cut.data(), cut.size()}), std::nullopt) << length;
    }
    std::string changed(whole);
    for (char& byte : changed) {
      const char original = byte;
      for (int value = 0; value < 256; ++value) {
        byte = static_cast<char>(value);
        if (problemIn(changed) == std::nullopt) read(changed);
      }
      byte = original;
    }
  }
}

}  // namespace
}  // namespace PropertyList
