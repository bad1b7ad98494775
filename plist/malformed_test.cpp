// SPDX-License-Identifier: Apache-2.0
#include "plist/test_messages.h"
#include "plist/writer.h"

namespace PropertyList {
namespace {

/// The problem that each of these messages has.
void all(std::optional<Problem> problem, const std::vector<std::string>& messages) {
  for (const std::string& message : messages) {
    EXPECT_EQ(problemIn(message), problem) << testing::PrintToString(message);
  }
}

std::string withTrailer(std::size_t offsetSize, std::size_t referenceSize, std::uint64_t objects,
                        std::uint64_t top, std::uint64_t table,
                        const std::string& before = bytes("bplist00\x09\x08")) {
  return before + "unused" + bigEndian(offsetSize, 1) + bigEndian(referenceSize, 1) +
         bigEndian(objects, 8) + bigEndian(top, 8) + bigEndian(table, 8);
}

TEST(Malformed, Trailer) {
  all(std::nullopt, {withTrailer(1, 1, 1, 0, 9)});
  all(Problem::empty, {""});
  all(Problem::truncated, {"bplist00", "bplist00" + std::string(31, '\1')});
  all(Problem::otherVersion, {withTrailer(1, 1, 1, 0, 9, bytes("bplist01\x09\x08"))});
  // No room for an object, widths of 0 and 9, with what they promise and without, no objects, a top
  // that is none of them.
  all(Problem::trailer,
      {withTrailer(1, 1, 1, 0, 8, "bplist00"), withTrailer(0, 1, 1, 0, 9),
       withTrailer(9, 1, 1, 0, 9), withTrailer(1, 0, 1, 0, 9), withTrailer(1, 9, 1, 0, 9),
       withTrailer(9, 1, 1, 0, 8, "bplist00" + std::string(9, '\x08')),
       withTrailer(1, 9, 1, 0, 18, "bplist00\xA1" + std::string(9, '\0') + "\x08"),
       withTrailer(1, 1, 0, 0, 9), withTrailer(1, 1, 1, 1, 9)});
  // Tables over the trailer, before the objects, beyond the end, overflowing, in the trailer.
  all(Problem::trailer,
      {withTrailer(1, 1, 1, 0, 10), withTrailer(1, 1, 1, 0, 7), withTrailer(1, 1, 1, 0, ~0ull),
       withTrailer(8, 1, 0x2000'0000'0000'0001, 0, 9), withTrailer(1, 1, 1, 0, 11)});
  // In the magic and in the table.
  all(Problem::objectOutside,
      {withTrailer(1, 1, 1, 0, 9, bytes("bplist00\x09\x00")), withTrailer(1, 1, 1, 0, 8)});
}

TEST(Malformed, BinaryObjects) {
  const std::string a = "\x51\x61", one = "\x10\x01", yes = "\x09";
  // An 8-byte count is sound, and so is damage in what nobody references.
  all(std::nullopt, {binary({"\x5F\x13" + bigEndian(1, 8) + "x"}), binary({"\xA0", "\x51\x80"})});
  all(Problem::unknownMarker,
      {binary({"\x0F"}), binary({"\x70"}), binary({"\xB0"}),
       binary({"\x15" + std::string(32, '\0')}), binary({bytes("\x21\0\0")}),
       binary({bytes("\x32\0\0\0\0")}), binary({"\x07"}), binary({"\x0A"}), binary({"\x90x"}),
       binary({"\xE0"})});
  // Numbers, text, references and values that are cut off; vast counts.
  all(Problem::objectOutside,
      {binary({"\x13" + std::string(7, '\0')}), binary({bytes("\x13\0\0\0")}), binary({"\x81x"}),
       binary({bytes("\x61\0")}), binary({"\x52y"}), binary({"\xA2\x01"}), binary({"\xD1\x01"}),
       binary({"\x5F\x13" + bigEndian(~0ull, 8)}), binary({"\x6F\x13" + bigEndian(1ull << 63, 8)}),
       binary({"\xDF\x13" + bigEndian(1ull << 63, 8)})});
  // A real, a marker of no type, an integer of 16 bytes.
  all(Problem::badCount, {binary({bytes("\x5F\x22\0\0\0\0")}), binary({bytes("\x5F\x0F\x01x")}),
                          binary({"\x5F\x14" + std::string(16, '\0')})});
  // The last stands under a key that nobody reads.
  all(Problem::notAscii,
      {binary({"\x52x\x80"}), binary({"\x5F\x10\x64" + std::string(99, 'x') + "\xFF"}),
       binary({"\xD2\x01\x02\x03\x04", a, "\x51\x62", yes, "\x51\x80"})});
  all(Problem::dateNotFinite, {binary({"\x33\x7F\xF8" + std::string(6, '\0')}),
                               binary({"\x33\xFF\xF0" + std::string(6, '\0')})});
  all(Problem::referenceOutOfRange, {binary({"\xA1\x01"})});
  // Integers, of which the second was read before, and a container.
  all(Problem::keyNotString,
      {binary({"\xD1\x01\x01", one}), binary({"\xA2\x01\x02", one, "\xD1\x01\x03", "\x51x"}),
       binary({"\xD2\x01\x02\x03\x03", a, one, yes}), binary({"\xD1\x01\x01", "\xA0"})});
  // As a key, as an element, by a set.
  all(Problem::selfContaining, {binary({bytes("\xD1\x00\x01"), yes}), binary({bytes("\xA1\x00")}),
                                binary({"\xA1\x01", bytes("\xC1\x00")})});
}

TEST(Malformed, Objects8BytesWide) {
  const Raw far{{"\xA1" + bigEndian((1ull << 63) + 1, 8), "\x09"}, 8, 8};
  EXPECT_EQ(problemIn(far.message()), Problem::referenceOutOfRange);
  for (std::size_t size = 1; size <= 8; ++size) {
    const Raw raw{{"\xA2" + bigEndian(2, size) + bigEndian(1, size), "\x09", "\x08"}, size, size};
    EXPECT_EQ(read(raw.message()), Tree(Array{false, true})) << size;
  }
}

const std::string sound = "<plist><true/></plist>";
const std::string type = "<!DOCTYPE plist PUBLIC \"-//Tessen//DTD PLIST 1.0//EN\" 'tessen.dtd'>";

TEST(Malformed, XmlMarkup) {
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
       "<?xml version='2.0'?>" + sound, "<?xml version='1.0' standalone='maybe'?>" + sound});
  all(Problem::utf16,
      {bytes("\xFE\xFF\0<\0p"), bytes("\xFF\xFE<\0p\0"), bytes("\0<\0?"), bytes("<\0?\0")});
  all(Problem::compressed, {"\x1F\x8B\x08" + sound});
  all(Problem::notPropertyList, {"plist", "{}", "\xEF\xBB\xBFx", "\xFF" + sound});
  all(Problem::truncated, {" ", "<?xml version='1.0'?>\n", "\xEF\xBB\xBF"});
  all(Problem::badDocumentType,
      {"<!DOCTYPE plist PUBLIC '{' 'x'>" + sound, "<!DOCTYPE plist PUBLIC '`' 'x'>" + sound,
       "<!DOCTYPE plist [<!ENTITY a 'b'>]>" + sound});
  all(Problem::unknownElement, {type + type + sound, xml(type + "<true/>")});
  all(Problem::badComment, {xml("<!-- -- --><true/>"), xml("<!-- ---><true/>")});
}

TEST(Malformed, XmlElements) {
  all(std::nullopt,
      {xml("<string>a</string\n>"), xml("<true></true>"), xml("<dict><key/><array/></dict>")});
  all(Problem::missingValue, {xml(""), "<plist/>", xml("<dict><key>a</key></dict>")});
  all(Problem::mismatchedEnd, {xml("<true/><true/>"), xml("<string>a</key>"),
                               xml("<array><dict></array></dict>"), xml("<string>a</ string>")});
  all(Problem::strayText,
      {sound + "x", sound + sound, xml("<array>x<true/></array>"), xml("<array>&#32;</array>"),
       xml("<string>]]></string>"), xml("<true>1</true>"), xml("<false> </false>")});
  all(Problem::unknownElement,
      {"<list><true/></list>", xml("<array><![CDATA[ ]]></array>"), xml("<uid>1</uid>"),
       xml("<Dict/>"), xml("<strings/>"), xml("<dat/>"), xml("<datum/>"), xml("<in/>"),
       xml("<pl/>"), "<plists/>", "<Plist/>", xml(std::string(100'000, '<'))});
  all(Problem::misplacedElement,
      {xml("<string><b/></string>"), xml("<array><key>a</key></array>"),
       xml("<dict><true/></dict>"), xml("<dict><key>a</key><key>b</key></dict>")});
  all(std::nullopt,
      {xml("<true _:a='' \xC3\xA9-1.\xCC\x80 = \"\"/>"), xml("<true a='1' b='2'\n></true>")});
  all(Problem::badTag,
      {xml("<true -a='1'/>"), xml("<true 1='1'/>"), xml("<true \xC3\x97='1'/>"), xml("<true a/>"),
       xml("<true a='1' / >"), xml("<true/ >"), "<plist a='><true/></plist>", xml("<true a=b/>"),
       xml("<true a='<'/>"), xml("<true a='1'b='2'/>")});
  all(Problem::duplicateAttribute,
      {xml("<true a='' a=''/>"), xml("<true a='1' b='' a=\"2\"/>"), xml("<true b='1' a='' a=''/>"),
       xml("<true a='' a='' b='1'/>")});
  all(Problem::badInteger, {xml("<integer/>")});
  all(Problem::badReal, {xml("<real></real>")});
  all(Problem::badBase64, {xml("<data>Q</data>"), xml("<data><![CDATA[QQ]]></data>")});
  all(Problem::badDate, {xml("<date/>")});
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
      {xml("<dict>" + key + "<true/>\n<key>&#97;</key><true/>\n</dict>"),
       "line 3, column 1: a dictionary has the same key twice"},
      {"<plist>\n<true/>", "line 2, column 8: the message ends too early"},
  };
  for (const auto& [message, expected] : cases) {
    EXPECT_EQ(faultIn(message), "Malformed property list at " + expected + ".") << message;
  }
}

TEST(Malformed, XmlCharacters) {
  const auto texts = [](std::optional<Problem> problem, const std::vector<std::string>& contents) {
    for (const std::string& text : contents) all(problem, {xml("<string>" + text + "</string>")});
  };
  texts(std::nullopt,
        {"\xF4\x8F\xBF\xBF&#x10FFFF;&#000000000000065;", "\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBD",
         "&#xD7FF;&#xE000;&#xFFFD;&#9;&#x20;\x7F"});
  texts(Problem::forbiddenCharacter, {std::string(1, '\0'), "a\x1F", "\x0B", "\xEF\xBF\xBE",
                                      "\xEF\xBF\xBF", "<![CDATA[\x0C]]>"});
  texts(Problem::badUtf8, {"\xC0\xAF", "\xED\xA0\x80", "\xE2\x82", "<![CDATA[\xC0]]>"});
  texts(Problem::badReference, {"&#0;", "&#31;", "&#xFFFE;", "&#xDFFF;", "&#xD800;", "&#xFFFF;",
                                "&#x110000;", "&#x10000000000000041;", "&#X41;", "&#;", "&nbsp;",
                                "a & b", "&lt", "&#x4g;", "&#65", "&#:;", "&#x;"});
  all(Problem::forbiddenCharacter, {xml("<!--\x01--><true/>"), xml("<true a='\x02'/>")});
  all(Problem::badUtf8, {xml("<?a \xFF?><true/>")});
  all(Problem::badReference, {xml("<true a='&x;'/>")});
}

}  // namespace
}  // namespace PropertyList
