// SPDX-License-Identifier: Apache-2.0
/// One pass over a line, and no tree of it: a line is as large as its message, and a tree of a
/// hostile id would be many times as large. Strings are decoded where they stand, so a message of
/// any length is never copied.
#include "cli/request_line.h"

#include "framework/json/writer.h"
#include "text/ascii.h"
#include "text/base64.h"
#include "text/utf8.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cstddef>

namespace Keelgate::CLI {

namespace {

enum Member : std::size_t { record, service, command, message, typed, id, none };

struct Rule {
  std::string_view key;
  /// What a value of the type can begin with; empty: any.
  std::string_view begins;
  std::string_view demand;
};

/// What a request may have, and nothing else.
constexpr std::array<Rule, none> rules = {{
    {"record", "\"", "a string"},
    {"service", "\"", "a string"},
    {"command", "-0123456789", "a number"},
    {"message", "\"", "a string"},
    {"typed", "tf", "true or false"},
    {"id", "", "any value"},
}};

/// Thrown and caught in this file: why a line is not a request.
struct Invalid {
  String why;
};

void demand(bool holds, std::string_view otherwise) {
  if (!holds) throw Invalid{String(otherwise)};
}

/// In the memory of the line: strings without their quotes, numbers and literals as they stand.
using Members = std::array<Optional<std::span<char>>, none>;

std::string_view textOf(std::span<const char> characters) {
  return {characters.data(), characters.size()};
}

/// The value of four hexadecimal digits; nothing where they are not that.
Optional<char32_t> hexadecimal(std::string_view text) {
  unsigned value = 0;
  const char* end = text.data() + std::min<std::size_t>(4, text.size());
  const bool all = std::from_chars(text.data(), end, value, 16).ptr == text.data() + 4;
  return all ? Optional<char32_t>(value) : std::nullopt;
}

constexpr std::string_view escapeLetters = "\"\\/bfnrt";

/// Decodes one escape, which is well-formed, to where `out` is, and gives its length. Never writes
/// more than that.
std::size_t unescape(std::string_view text, char*& out) {
  if (text[1] != 'u') {
    *out++ = "\"\\/\b\f\n\r\t"[escapeLetters.find(text[1])];
    return 2;
  }
  char32_t character = *hexadecimal(text.substr(2));
  std::size_t length = 6;
  if (character >= 0xd800 && character < 0xdc00 && text.substr(6, 2) == "\\u") {
    const char32_t low = *hexadecimal(text.substr(8)) - 0xdc00;
    // Any other than the second half leaves a first half alone.
    if (low < 0x400) character = 0x10000 + ((character - 0xd800) << 10) + low;
    length = 12;
  }
  // There are no characters for it, so it could not be written back.
  demand(!Text::isSurrogate(character), "a string holds half of a surrogate pair");
  out += Text::encodeUtf8(character, out);
  return length;
}

/// The characters that the inside of a well-formed string stands for, in its own place.
std::string_view unescaped(std::span<char> characters) {
  std::string_view text = textOf(characters);
  if (text.find('\\') == std::string_view::npos) return text;
  char* out = characters.data();
  while (!text.empty()) {
    std::size_t length = 1;
    if (text.front() == '\\') {
      length = unescape(text, out);
    } else {
      *out++ = text.front();
    }
    text.remove_prefix(length);
  }
  return {characters.data(), out};
}

/// Reads JSON from the beginning of a text, strictly. Throws Invalid at the first thing that is not
/// JSON.
class Reader {
 public:
  explicit Reader(std::span<char> line) : line_(line) {}

  void skipSpace() {
    while (peek() == ' ' || peek() == '\t' || peek() == '\r' || peek() == '\n') ++at_;
  }
  /// 0 at the end. A null character is not JSON anywhere, so it may look like it.
  [[nodiscard]] char peek() const { return at_ < line_.size() ? line_[at_] : '\0'; }
  [[nodiscard]] bool isAtEnd() const { return at_ == line_.size(); }
  bool take(char c) {
    if (peek() != c) return false;
    ++at_;
    return true;
  }
  void expect(char c) {
    skipSpace();
    if (!take(c)) fail(fmt::format("\"{}\" is missing", c));
  }

  /// A string, without its quotes, its escapes as they stand.
  std::span<char> string() {
    expect('"');
    const std::size_t begin = at_;
    const std::string_view text = textOf(line_);
    for (std::size_t quote = begin;;) {
      // Once for each quote, and not for each escape: there may be as many as there are characters.
      if (quote <= at_) quote = std::min(text.find('"', at_), text.size());
      const std::string_view plain = text.substr(at_, quote - at_);
      const std::size_t length = std::min(plain.find('\\'), plain.size());
      checkControls(plain.substr(0, length));
      at_ += length;
      if (peek() != '\\') break;
      skipEscape();
    }
    expect('"');
    return line_.subspan(begin, at_ - 1 - begin);
  }

  /// The key of a member, and the colon behind it.
  std::span<char> key() {
    const std::span<char> key = string();
    expect(':');
    skipSpace();
    return key;
  }

  /// A value of any depth, without recursion, which would let a nested id choose the depth of the
  /// stack. `copy` gets what it is made of, without white space between.
  std::span<char> value(String* copy) {
    String open;
    const std::size_t begin = at_;
    do {
      if (beginsValue(open, copy)) continue;
      while (!open.empty()) {
        skipSpace();
        if (take(',')) {
          add(copy, ",");
          if (open.back() == '}') member(copy);
          skipSpace();
          break;
        }
        expect(open.back());
        add(copy, {&open.back(), 1});
        open.pop_back();
      }
    } while (!open.empty());
    return line_.subspan(begin, at_ - begin);
  }

  [[noreturn]] void fail(std::string_view what) const {
    throw Invalid{fmt::format("not readable as JSON: {} (at byte {})", what, at_ + 1)};
  }

 private:
  static void add(String* copy, std::string_view text) {
    if (copy != nullptr) *copy += text;
  }

  /// A scalar, an empty container, or the beginning of another: true where a value comes next.
  bool beginsValue(String& open, String* copy) {
    const std::size_t begin = at_;
    const char c = peek();
    if (c == '{' || c == '[') {
      ++at_;
      open += c == '{' ? '}' : ']';
      add(copy, {&c, 1});
      skipSpace();
      if (peek() == open.back()) return false;
      if (c == '{') member(copy);
      return true;
    }
    if (c == '"') {
      string();
    } else if (c == '-' || Text::isDigit(c)) {
      number();
    } else {
      literal();
    }
    // What the id has in it goes to a terminal as it stands.
    if (copy != nullptr) *copy += JSON::withoutControls(textOf(line_.subspan(begin, at_ - begin)));
    return false;
  }

  void member(String* copy) {
    const std::span<char> name = key();
    if (copy != nullptr) *copy += '"' + JSON::withoutControls(textOf(name)) + "\":";
  }

  void skipEscape() {
    ++at_;
    if (take('u')) {
      if (!hexadecimal(textOf(line_.subspan(at_)))) fail("not an escape");
      at_ += 4;
    } else {
      if (escapeLetters.find(peek()) == std::string_view::npos) fail("not an escape");
      ++at_;
    }
  }

  void checkControls(std::string_view text) const {
    unsigned char found = 0;
    // Without an early end or a branch, so that the compiler takes many characters at a time.
    for (const char c : text) found |= static_cast<unsigned char>(c) < 0x20 ? 1 : 0;
    if (found != 0) fail("a control character in a string");
  }

  void digits() {
    if (!Text::isDigit(peek())) fail("not a number");
    while (Text::isDigit(peek())) ++at_;
  }

  void number() {
    take('-');
    if (!take('0')) digits();
    if (take('.')) digits();
    if (take('e') || take('E')) {
      if (!take('+')) take('-');
      digits();
    }
  }

  void literal() {
    for (const std::string_view word : {"true", "false", "null"}) {
      if (!textOf(line_.subspan(at_)).starts_with(word)) continue;
      at_ += word.size();
      return;
    }
    fail("not a value");
  }

  const std::span<char> line_;
  std::size_t at_ = 0;
};

/// The members of a request. Remembers the first thing wrong and goes on, so that an id further
/// down is still found.
class RequestReader {
 public:
  explicit RequestReader(std::span<char> line) : reader_(line) {}

  void read() {
    reader_.skipSpace();
    if (reader_.isAtEnd()) reader_.fail("an empty line");
    demand(reader_.take('{'), "a request is a JSON object");
    reader_.skipSpace();
    if (!reader_.take('}')) {
      do {
        member();
        reader_.skipSpace();
      } while (reader_.take(','));
      reader_.expect('}');
    }
    reader_.skipSpace();
    if (!reader_.isAtEnd()) reader_.fail("more than one value");
  }

  [[nodiscard]] const Members& members() const { return members_; }
  [[nodiscard]] const String& problem() const { return problem_; }
  [[nodiscard]] Optional<String> takeId() {
    if (idIsAmbiguous_ || !members_[id]) return std::nullopt;
    return std::move(id_);
  }

 private:
  void wrong(String problem) {
    // The first is the one that explains the others.
    if (problem_.empty()) problem_ = std::move(problem);
  }

  Member memberOf(std::string_view key) {
    const auto rule = std::ranges::find(rules, key, &Rule::key);
    const auto member = static_cast<Member>(rule - rules.begin());
    if (member == none) {
      wrong(fmt::format("unknown key {}", JSON::quote(key)));
    } else if (members_[member]) {
      wrong(fmt::format("the key \"{}\" stands twice", key));
      // To echo either would be a guess, and the caller would take the reply for another's.
      if (member == id) idIsAmbiguous_ = true;
      return none;
    }
    return member;
  }

  void member() {
    const Member member = memberOf(unescaped(reader_.key()));
    const Bool fits = member != none && (rules[member].begins.empty() ||
                                         rules[member].begins.find(reader_.peek()) != String::npos);
    if (member != none && !fits) {
      wrong(fmt::format("\"{}\" must be {}", rules[member].key, rules[member].demand));
    }
    const Bool isString = reader_.peek() == '"';
    std::span<char> value =
        isString && member != id ? reader_.string() : reader_.value(member == id ? &id_ : nullptr);
    if (fits) members_[member] = value;
  }

  Reader reader_;
  Members members_;
  String id_;
  String problem_;
  bool idIsAmbiguous_ = false;
};

JSON::Subject subjectOf(const Members& members) {
  if (members[record]) {
    demand(!members[service] && !members[command],
           "\"record\" excludes \"service\" and \"command\"");
    String name(unescaped(*members[record]));
    if (!JSON::isRecordName(name)) {
      throw Invalid{fmt::format("unknown record {}: one of {}", JSON::quote(name),
                                fmt::join(JSON::recordNames(), ", "))};
    }
    demand(!members[typed] || name == JSON::propertyList,
           "\"typed\" belongs to the record PropertyList");
    return name;
  }
  demand(!members[typed], "\"typed\" needs \"record\"");
  demand(members[service] || members[command], "neither \"record\" nor \"service\" is given");
  demand(members[service].has_value(), "\"command\" needs \"service\"");
  demand(members[command].has_value(), "\"service\" needs \"command\"");
  // JSON also has -1, 1.5 and 1e3, which are numbers and not commands.
  const Optional<UInt64> number = decimal(textOf(*members[command]));
  demand(number.has_value(), "\"command\" must be an integer from 0 to 18446744073709551615");
  return VespClientMessageContext{.command = *number,
                                  .service = String(unescaped(*members[service]))};
}

StreamRequest requestOf(const Members& members) {
  JSON::Subject subject = subjectOf(members);
  demand(members[message].has_value(), "\"message\" is missing");
  char* const begin = members[message]->data();
  const Optional<std::size_t> size =
      Text::decodeBase64(unescaped(*members[message]), begin, Text::Base64::strict);
  demand(size.has_value(), "\"message\" is not base64 with padding");
  return {.subject = std::move(subject),
          .message = std::as_bytes(std::span(begin, *size)),
          .typed = members[typed] && members[typed]->front() == 't'};
}

}  // namespace

Optional<UInt64> decimal(std::string_view text) {
  UInt64 number = 0;
  const char* end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, number);
  // All of the text or none: "12a" is not 12.
  if (error != std::errc() || rest != end) return std::nullopt;
  return number;
}

RequestLine readRequestLine(std::span<char> line) {
  RequestLine read;
  try {
    demand(Text::isUtf8(textOf(line)), "not readable as JSON: not UTF-8");
    RequestReader request(line);
    request.read();
    // Only from a line that was read to its end: half an id is another one.
    read.id = request.takeId();
    demand(request.problem().empty(), request.problem());
    read.content = requestOf(request.members());
  } catch (Invalid& invalid) {
    read.content = std::move(invalid.why);
  }
  return read;
}

}  // namespace Keelgate::CLI
