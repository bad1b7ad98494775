// SPDX-License-Identifier: Apache-2.0
#include "plist/document.h"

#include "plist/test_messages.h"
#include "plist/writer.h"

#include <limits>
#include <stdexcept>

namespace PropertyList {
namespace {

std::string textOf(const std::string& element, const std::string& content) {
  const Tree tree = read(xml("<" + element + ">" + content + "</" + element + ">"));
  if (const auto* data = std::get_if<Data>(&tree.value)) {
    return {reinterpret_cast<const char*>(data->data()), data->size()};
  }
  return std::get<std::string>(tree.value);
}

/// Wherever it stands: what reads many bytes at a time has an edge somewhere.
TEST(Document, XmlTextMeansWhatXmlSaysAtEveryPlace) {
  const std::pair<std::string, std::string> pieces[] = {
      {"", ""},
      {" a\tb\n", " a\tb\n"},
      {"&lt;&gt;&amp;&quot;&apos;&#65;&#x1F600;", "<>&\"'A\xF0\x9F\x98\x80"},
      {"a\r\nb\rc&#13;d", "a\nb\nc\rd"},
      {"<![CDATA[<&\r\n]]]]><![CDATA[>]]>x", "<&\n]]>x"},
      {"a<!--<-->b<?or this?>c", "abc"},
      {"]] > ]", "]] > ]"},
      {"&amp;lt;", "&lt;"},
      {"\xC3\xA9\x7F\xE6\xBC\xA2", "\xC3\xA9\x7F\xE6\xBC\xA2"}};
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
  for (const char* content : {"\n\tQU\r\n\tJD ", "QU<!-- -->JD", "&#81;UJD"}) {
    EXPECT_EQ(textOf("data", content), "ABC") << content;
  }
  for (const char* content : {"Q", "<![CDATA[QQ]]>"}) {
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
  const std::pair<std::string, Tree> sound[] = {
      {utf16({0x7F, 0x80, 0x7FF, 0x800, 0xD7FF, 0xE000, 0xFFFF, 0}),
       bytes("\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF\0")},
      {utf16({0xD800, 0xDC00, 0xDBFF, 0xDFFF}), "\xF0\x90\x80\x80\xF4\x8F\xBF\xBF"}};
  for (const auto& [message, text] : sound) {
    EXPECT_EQ(read(message), text);
    EXPECT_EQ(treeOf(writeBinary(text)), text);
  }
  for (const std::string& message :
       {utf16({0xDC00}), utf16({0xD800}), utf16({0xDBFF}), utf16({0xDFFF, 0x41}),
        utf16({0xD800, 0x41}), utf16({0xD800, 0xDBFF}), utf16({0xD800, 0xE000}),
        utf16({0xDC00, 0xDC00}), utf16({0x41, 0xD800})}) {
    EXPECT_EQ(problemIn(message), Problem::straySurrogate);
  }
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

TEST(Writers, WidthsOfReferencesAndOffsets) {
  for (const std::size_t count : {254u, 255u, 256u, 257u, 65'534u, 65'535u, 65'536u, 65'537u}) {
    Array elements;
    for (std::size_t i = 0; i < count; ++i) elements.emplace_back(i);
    const auto message = writeBinary(elements);
    const Document document(message);
    std::uint64_t expected = 0;
    for (const Value value : document.top().elements()) {
      ASSERT_EQ(value.integer(), (Integer{expected++, false}));
    }
    EXPECT_EQ(expected, count);
  }
}

TEST(Writers, RefuseWhatTheFormatHasNot) {
  for (const Tree& tree :
       {Tree(nullptr), Tree(Uid{1}), Tree(Set{}), Tree(Date{0.5}), Tree(Date{-63'113'904'001}),
        Tree(Date{252'423'993'600}), Tree("\x01"), Tree("\xEF\xBF\xBF"), Tree("\xFF")}) {
    EXPECT_THROW(writeXml(tree), std::invalid_argument);
  }
  EXPECT_THROW(writeBinary("\xC0\x80"), std::invalid_argument);
  EXPECT_THROW(writeBinary(Date{std::numeric_limits<double>::infinity()}), std::invalid_argument);
}

}  // namespace
}  // namespace PropertyList
