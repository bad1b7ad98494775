// SPDX-License-Identifier: Apache-2.0
/// Containers wait on a stack of their own, as in the readers.
#include <array>
#include <charconv>
#include <cmath>
#include <stdexcept>

#include "plist/writer.h"
#include "plist/xml/characters.h"
#include "text/base64.h"
#include "text/date_time.h"
#include "text/utf8.h"

namespace PropertyList {
namespace {

/// All three that could be taken for markup, also where XML would let '>' stand.
void appendEscaped(std::string& out, std::string_view text) {
  while (!text.empty()) {
    const Text::Character next = Text::firstCharacter(text);
    if (next.length == 0 || !isXmlCharacter(next.codePoint)) {
      throw std::invalid_argument("A string holds what XML cannot");
    }
    switch (next.codePoint) {
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      case '&':
        out += "&amp;";
        break;
      // A bare one would be read as a line feed.
      case '\r':
        out += "&#13;";
        break;
      default:
        out += text.substr(0, next.length);
    }
    text.remove_prefix(next.length);
  }
}

/// The shortest spelling that reads back as the same double.
std::string spelt(double number) {
  if (std::isnan(number)) return "nan";
  std::array<char, 32> text{};
  const auto end = std::to_chars(text.data(), text.data() + text.size(), number).ptr;
  return {text.data(), end};
}

std::string spelt(Date date) {
  const auto text = Text::dateTimeText(date.seconds);
  if (!text || date.seconds != std::floor(date.seconds)) {
    throw std::invalid_argument("XML has no spelling for this date");
  }
  return *text;
}

class XmlWriter {
 public:
  std::string write(const Tree& tree);

  // One per type: scalars are written, containers opened.
  void operator()(std::nullptr_t) { throw std::invalid_argument("XML has no null"); }
  void operator()(Uid) { throw std::invalid_argument("XML has no UIDs"); }
  void operator()(const Set&) { throw std::invalid_argument("XML has no sets"); }
  void operator()(bool boolean) { line(boolean ? "<true/>" : "<false/>"); }
  void operator()(std::int64_t number) { element("integer", std::to_string(number)); }
  void operator()(std::uint64_t number) { element("integer", std::to_string(number)); }
  void operator()(double number) { element("real", spelt(number)); }
  void operator()(Date date) { element("date", spelt(date)); }
  void operator()(const std::string& text) { element("string", text); }
  void operator()(const Data& data) { element("data", Text::encodeBase64(data)); }
  void operator()(const Array& elements) { open({&elements, nullptr, 0}); }
  void operator()(const Dictionary& entries) { open({nullptr, &entries, 0}); }

 private:
  struct Frame {
    const Array* array;
    const Dictionary* dictionary;
    std::size_t next;
  };

  void line(std::string_view text);
  void element(std::string_view name, std::string_view text);
  void open(Frame frame);
  void step();

  std::string out_;
  // The containers that are open, outermost first; their number is the indentation.
  std::vector<Frame> frames_;
};

void XmlWriter::line(std::string_view text) {
  out_.append(frames_.size(), '\t').append(text).push_back('\n');
}

void XmlWriter::element(std::string_view name, std::string_view text) {
  out_.append(frames_.size(), '\t').append("<").append(name).append(">");
  appendEscaped(out_, text);
  out_.append("</").append(name).append(">\n");
}

void XmlWriter::open(Frame frame) {
  line(frame.array != nullptr ? "<array>" : "<dict>");
  frames_.push_back(frame);
}

/// Writes the next child of the innermost container, or its end tag.
void XmlWriter::step() {
  Frame& frame = frames_.back();
  const bool isArray = frame.array != nullptr;
  const std::size_t count = isArray ? frame.array->size() : frame.dictionary->size();
  if (frame.next == count) {
    frames_.pop_back();
    return line(isArray ? "</array>" : "</dict>");
  }
  const std::size_t index = frame.next++;
  if (isArray) return std::visit(*this, (*frame.array)[index].value);
  const auto& [key, value] = (*frame.dictionary)[index];
  element("key", key);
  std::visit(*this, value.value);
}

std::string XmlWriter::write(const Tree& tree) {
  out_ = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
  std::visit(*this, tree.value);
  while (!frames_.empty()) step();
  return std::move(out_ += "</plist>\n");
}

}  // namespace

std::string writeXml(const Tree& tree) {
  return XmlWriter().write(tree);
}

}  // namespace PropertyList
