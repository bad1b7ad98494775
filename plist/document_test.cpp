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

TEST(Document, Base64) {
  EXPECT_EQ(textOf("data", " \n"), "");
  EXPECT_EQ(textOf("data", "QQ=="), "A");
  EXPECT_EQ(textOf("data", "QUI="), "AB");
  EXPECT_EQ(textOf("data", "\n\tQUJD\n\tREVG\n\tRw = =\n"), "ABCDEFG");
  for (const char* content :
       {"QUJD", "Q U\r\nJ\tD", "\n\tQU\n\tJD\n\t", "QU<!-- -->JD", "&#81;UJD"}) {
    EXPECT_EQ(textOf("data", content), "ABC") << content;
  }
  for (const char* content : {"Q", "QQ", "QQ=", "QUJ", "Q===", "=", "====", "QQ==QQ==", "QQ=A",
                              "QQ===", "QUJD=", "QU-_", "QUJ*", "QUJDQ\xC3\xA9=="}) {
    EXPECT_EQ(problemIn(xml("<data>" + std::string(content) + "</data>")), Problem::badBase64)
        << content;
  }
}

TEST(Document, Utf16) {
  EXPECT_EQ(read(binary({bytes("\x66\0A\0\xE9\x20\xAC\xD8\x3D\xDE\x00\xFF\xFE")})),
            Tree("A\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\xEF\xBF\xBE"));
}

TEST(Document, TypesThatNoFieldTakes) {
  const std::string message = binary({"\xC4\x01\x02\x03\x04", bytes("\x00"), bytes("\x80\x07"),
                                      "\x8F" + std::string(16, 'u'), "\xA0"});
  EXPECT_EQ(read(message), Tree(Set{{nullptr, Uid{0}, Uid{0}, Array{}}}));
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
