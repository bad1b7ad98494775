// SPDX-License-Identifier: Apache-2.0
#include "plist/document.h"

#include <stdexcept>

#include "plist/test_messages.h"

namespace PropertyList {
namespace {

std::string textOf(const std::string& element, const std::string& content) {
  const Tree tree = read(xml("<" + element + ">" + content + "</" + element + ">"));
  if (const auto* data = std::get_if<Data>(&tree.value)) {
    return {reinterpret_cast<const char*>(data->data()), data->size()};
  }
  return std::get<std::string>(tree.value);
}

TEST(Document, XmlTextMeansWhatXmlSays) {
  const std::string longText(1000, 'x');
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"", ""},
      {" a\tb\n", " a\tb\n"},
      {"&lt;&gt;&amp;&quot;&apos;&#65;&#x1F600;", "<>&\"'A\xF0\x9F\x98\x80"},
      {"a\r\nb\rc&#13;d", "a\nb\nc\rd"},
      {"<![CDATA[<&\r\n]]]]><![CDATA[>]]>x", "<&\n]]>x"},
      {"a<!-- no -->b<?or this?>c", "abc"},
      {"]] > ]", "]] > ]"},
      {"&amp;lt;", "&lt;"},
      {"\xC3\xA9" + longText + "&amp;\xE6\xBC\xA2", "\xC3\xA9" + longText + "&\xE6\xBC\xA2"},
  };
  for (const auto& [content, meaning] : cases) EXPECT_EQ(textOf("string", content), meaning);
}

/// Wherever it stands: what reads many bytes at a time has an edge somewhere.
TEST(Document, XmlTextMeansTheSameAtEveryPlace) {
  const std::pair<std::string, std::string> pieces[] = {
      {"&amp;", "&"},       {"<![CDATA[<&]]>", "<&"}, {"\r\n", "\n"},
      {"\r", "\n"},         {"<!--<-->", ""},         {"\xC3\xA9", "\xC3\xA9"},
      {"]]", "]]"},         {"\t\n", "\t\n"},         {"&#x1F600;", "\xF0\x9F\x98\x80"},
      {"&#65;&#66;", "AB"}, {"<?p ?>", ""},           {">", ">"},
      {"\x7F", "\x7F"}};
  for (std::size_t before = 0; before < 40; ++before) {
    for (std::size_t after : {0u, 1u, 15u, 17u}) {
      const std::string left(before, 'x'), right(after, 'y');
      std::string content, meaning;
      for (const auto& [spelt, meant] : pieces) {
        EXPECT_EQ(textOf("string", left + spelt + right), left + meant + right);
        content += left + spelt + right;
        meaning += left + meant + right;
      }
      EXPECT_EQ(textOf("string", content), meaning);
      for (const std::string bad : {"\x1F", "\x80", "]]>", "&"}) {
        EXPECT_NE(problemIn(xml("<string>" + left + bad + right + "</string>")), std::nullopt);
      }
    }
  }
}

TEST(Document, Base64) {
  EXPECT_EQ(textOf("data", "\n\tQUJD\n\tREVG\n\tRw = =\n"), "ABCDEFG");
  for (const char* content :
       {"QUJD", "Q U\r\nJ\tD", "\n\tQU\n\tJD\n\t", "QU<!-- -->JD", "&#81;UJD"}) {
    EXPECT_EQ(textOf("data", content), "ABC") << content;
  }
  for (const char* content : {"Q", "QQ==QQ==", "QUJDQ\xC3\xA9==", "<![CDATA[QQ]]>"}) {
    EXPECT_EQ(problemIn(xml("<data>" + std::string(content) + "</data>")), Problem::badBase64)
        << content;
  }
}

TEST(Document, Utf16) {
  const auto utf16 = [](std::initializer_list<std::uint64_t> units) {
    std::string text(1, static_cast<char>(0x60 + units.size()));
    for (const std::uint64_t unit : units) text += bigEndian(unit, 2);
    return binary({text});
  };
  EXPECT_EQ(read(utf16({0x7F, 0x80, 0x7FF, 0x800, 0xD7FF, 0xE000, 0xFFFF, 0})),
            Tree(bytes("\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF\0")));
  EXPECT_EQ(read(utf16({0xD800, 0xDC00, 0xDBFF, 0xDFFF})),
            Tree("\xF0\x90\x80\x80\xF4\x8F\xBF\xBF"));
  for (const std::string& message :
       {utf16({0xDC00}), utf16({0xD800}), utf16({0xDBFF}), utf16({0xDFFF, 0x41}),
        utf16({0xD800, 0x41}), utf16({0xD800, 0xDBFF}), utf16({0xD800, 0xE000}),
        utf16({0xDC00, 0xDC00}), utf16({0x41, 0xD800})}) {
    EXPECT_EQ(problemIn(message), Problem::straySurrogate);
  }
  EXPECT_EQ(read(binary({bytes("\x66\0A\0\xE9\x20\xAC\xD8\x3D\xDE\x00\xFF\xFE")})),
            Tree("A\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\xEF\xBF\xBE"));
}

TEST(Document, TypesThatNoFieldTakes) {
  const std::string message = binary({"\xC4\x01\x02\x03\x04", bytes("\x00"), bytes("\x80\x07"),
                                      "\x88" + bigEndian(1, 1) + bigEndian(2, 8), "\xA0"});
  EXPECT_THROW(read(message), std::out_of_range);
  EXPECT_EQ(read(binary({"\xC4\x01\x02\x03\x04", bytes("\x00"), bytes("\x80\x07"),
                         "\x8F" + bigEndian(0, 8) + bigEndian(~0ull, 8), "\xA0"})),
            Tree(Set{{nullptr, Uid{7}, Uid{~0ull}, Array{}}}));
}

TEST(Document, AskingForAnotherTypeIsRefused) {
  const std::string message = xml("<dict><key>a</key><integer>1</integer></dict>");
  const Document document(bytesOf(message));
  const Value top = document.top();
  EXPECT_EQ(top.count(), 1u);
  const Value number = (*top.entries().begin()).value;
  EXPECT_THROW(number.real(), std::logic_error);
  EXPECT_THROW(number.string(), std::logic_error);
  EXPECT_THROW(number.data(), std::logic_error);
  EXPECT_THROW(number.count(), std::logic_error);
  EXPECT_THROW(number.entries(), std::logic_error);
  EXPECT_THROW(top.elements(), std::logic_error);
}

TEST(Document, StringsAreViewsIntoTheMessage) {
  const std::string message = xml("<array><string>plain</string></array>");
  const Document document(bytesOf(message));
  const std::string_view text = (*document.top().elements().begin()).string();
  EXPECT_EQ(text.data(), message.data() + message.find("plain"));
}

}  // namespace
}  // namespace PropertyList
