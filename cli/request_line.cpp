// SPDX-License-Identifier: Apache-2.0
/// Read as events and never as a tree: a line is as large as its message, and a tree of a hostile
/// id would be many times as large. Strings are decoded where they stand, so a message of any
/// length is never copied.
#include "cli/request_line.h"

#include "text/base64.h"
#include "text/utf8.h"

#include <fmt/format.h>
#ifdef __SSE2__
// Sixteen characters of a string at a time.
#define RAPIDJSON_SSE2
#endif
#include <rapidjson/error/en.h>
#include <rapidjson/reader.h>

#include <array>
#include <charconv>
#include <utility>

namespace Keelgate::CLI {

namespace {

using rapidjson::SizeType;

enum Member : std::size_t { record, service, command, message, typed, id, none };

struct Rule {
  std::string_view key;
  /// The type that the value must have; kNullType stands for any.
  rapidjson::Type type;
  std::string_view demand;
};

/// What a request may have, and nothing else.
constexpr std::array<Rule, none> rules = {{
    {"record", rapidjson::kStringType, "a string"},
    {"service", rapidjson::kStringType, "a string"},
    {"command", rapidjson::kNumberType, "a number"},
    {"message", rapidjson::kStringType, "a string"},
    {"typed", rapidjson::kTrueType, "true or false"},
    {"id", rapidjson::kNullType, "any value"},
}};

/// Each value in the memory of the line: a string without its quotes, a number as it was written.
using Members = std::array<Optional<std::string_view>, none>;

/// Takes the reader's events: notes the members, copies the id, remembers the first thing wrong
/// and goes on, so that an id further down is still found.
class RequestReader : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, RequestReader> {
 public:
  bool Null() { return scalar("null", rapidjson::kNullType); }
  bool Bool(bool value) { return scalar(value ? "true" : "false", rapidjson::kTrueType); }
  // Digit by digit as it was written: a double in between would change a command above 2^53.
  bool RawNumber(const char* text, SizeType size, bool) {
    return scalar({text, size}, rapidjson::kNumberType);
  }
  bool String(const char* text, SizeType size, bool) {
    return isText({text, size}) && scalar({text, size}, rapidjson::kStringType);
  }
  bool StartObject() {
    // The request itself. Anything else at this depth is not an object.
    if (depth_ == 0) return ++depth_ == 1;
    if (member_ == id) id_.beginObject();
    return open();
  }
  bool StartArray() {
    if (member_ == id) id_.beginArray();
    return open();
  }
  bool EndObject(SizeType) {
    if (member_ == id && depth_ > 1) id_.endObject();
    return close(rapidjson::kObjectType);
  }
  bool EndArray(SizeType) {
    if (member_ == id) id_.endArray();
    return close(rapidjson::kArrayType);
  }
  bool Key(const char* text, SizeType size, bool) {
    const std::string_view key(text, size);
    if (!isText(key)) return false;
    if (depth_ == 1) {
      select(key);
    } else if (member_ == id) {
      id_.key(key);
    }
    return true;
  }

  [[nodiscard]] const Members& members() const { return members_; }
  [[nodiscard]] const Keelgate::String& problem() const { return problem_; }
  /// Of no more use than once.
  [[nodiscard]] Optional<Keelgate::String> takeId() {
    if (idIsAmbiguous_ || !members_[id]) return std::nullopt;
    Keelgate::String all;
    for (const Keelgate::String& piece : std::move(id_).take()) all += piece;
    all.pop_back();
    return all;
  }

 private:
  void wrong(Keelgate::String problem) {
    // The first is the one that explains the others.
    if (problem_.empty()) problem_ = std::move(problem);
  }

  /// The reader lets an escaped half of a surrogate pair pass. Such a text, and so such an id,
  /// could not be written back. Base64 is checked by its own decoder.
  bool isText(std::string_view text) {
    if (member_ == message || Text::isUtf8(text)) return true;
    wrong("a string holds half of a surrogate pair");
    return false;
  }

  void select(std::string_view key) {
    std::size_t i = 0;
    while (i < rules.size() && rules[i].key != key) ++i;
    member_ = static_cast<Member>(i);
    if (member_ == none) {
      wrong(fmt::format("unknown key {}", JSON::quote(key)));
    } else if (members_[member_]) {
      wrong(fmt::format("the key \"{}\" stands twice", key));
      // To echo either would be a guess, and the caller would take the reply for another's.
      if (member_ == id) idIsAmbiguous_ = true;
      member_ = none;
    }
  }

  bool scalar(std::string_view value, rapidjson::Type type) {
    if (depth_ == 0) return notAnObject();
    if (member_ == id) {
      type == rapidjson::kStringType ? id_.string(value) : id_.raw(value);
    }
    if (depth_ == 1) finish(value, type);
    return true;
  }

  bool open() {
    if (depth_ == 0) return notAnObject();
    ++depth_;
    return true;
  }

  bool close(rapidjson::Type type) {
    if (--depth_ == 1) finish({}, type);
    return true;
  }

  /// A whole value of the request itself has been read.
  void finish(std::string_view value, rapidjson::Type type) {
    const Member member = std::exchange(member_, none);
    if (member == none) return;
    if (rules[member].type == type || rules[member].type == rapidjson::kNullType) {
      members_[member] = value;
    } else {
      wrong(fmt::format("\"{}\" must be {}", rules[member].key, rules[member].demand));
    }
  }

  bool notAnObject() {
    wrong("a request is a JSON object");
    return false;
  }

  Members members_;
  Member member_ = none;
  std::size_t depth_ = 0;
  JSON::Writer id_{JSON::Layout::compact};
  Keelgate::String problem_;
  bool idIsAmbiguous_ = false;
};

/// The reader compares with 0x19 where it should with 0x1f, and lets some control characters pass.
bool hasForbiddenControl(std::string_view line) {
  unsigned char found = 0;
  // Without an early end or a branch, so that the compiler takes many characters at a time.
  for (const char c : line) found |= static_cast<unsigned char>(c - 0x1a) < 6 ? 1 : 0;
  return found != 0;
}

/// Thrown and caught in this file: why a line is not a request.
struct Invalid {
  String why;
};

void demand(bool holds, std::string_view otherwise) {
  if (!holds) throw Invalid{String(otherwise)};
}

JSON::Subject subjectOf(const Members& members) {
  if (members[record]) {
    demand(!members[service] && !members[command],
           "\"record\" excludes \"service\" and \"command\"");
    if (!JSON::isRecordName(*members[record])) {
      throw Invalid{fmt::format("unknown record {}: one of {}", JSON::quote(*members[record]),
                                fmt::join(JSON::recordNames(), ", "))};
    }
    demand(!members[typed] || *members[record] == JSON::propertyList,
           "\"typed\" belongs to the record PropertyList");
    return String(*members[record]);
  }
  demand(!members[typed], "\"typed\" needs \"record\"");
  demand(members[service] || members[command], "neither \"record\" nor \"service\" is given");
  demand(members[service].has_value(), "\"command\" needs \"service\"");
  demand(members[command].has_value(), "\"service\" needs \"command\"");
  // JSON also has -1, 1.5 and 1e3, which are numbers and no commands.
  const Optional<UInt64> number = decimal(*members[command]);
  demand(number.has_value(), "\"command\" must be an integer from 0 to 18446744073709551615");
  return VespClientMessageContext{.command = *number, .service = String(*members[service])};
}

Request requestOf(const Members& members, String& line) {
  JSON::Subject subject = subjectOf(members);
  demand(members[message].has_value(), "\"message\" is missing");
  char* begin = line.data() + (members[message]->data() - line.data());
  const Optional<std::size_t> size =
      Text::decodeBase64(*members[message], begin, Text::Base64::strict);
  demand(size.has_value(), "\"message\" is not base64 with padding");
  return {.subject = std::move(subject),
          .message = std::as_bytes(std::span(begin, *size)),
          .typed = members[typed] == "true"};
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

RequestLine readRequestLine(String& line) {
  // Iterative, because recursion would let a nested id choose the depth of the stack.
  constexpr unsigned flags = rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseInsituFlag |
                             rapidjson::kParseIterativeFlag;
  RequestLine read;
  try {
    demand(Text::isUtf8(line), "not readable as JSON: not UTF-8");
    demand(!hasForbiddenControl(line), "not readable as JSON: a control character");
    // The reader looks at whole blocks of this size, the last one included.
    constexpr std::size_t block = 16;
    line.reserve(line.size() + block);
    rapidjson::InsituStringStream stream(line.data());
    rapidjson::Reader reader;
    RequestReader request;
    const rapidjson::ParseResult result = reader.Parse<flags>(stream, request);
    if (result.IsError() && result.Code() != rapidjson::kParseErrorTermination) {
      throw Invalid{fmt::format("not readable as JSON: {} (at byte {})",
                                rapidjson::GetParseError_En(result.Code()), result.Offset())};
    }
    if (!result.IsError()) {
      // The reader takes a null character for the end.
      demand(stream.Tell() == line.size(), "not readable as JSON: a null character");
      // Only from a line that was read to its end: half an id is another one.
      read.id = request.takeId();
    }
    demand(request.problem().empty(), request.problem());
    read.content = requestOf(request.members(), line);
  } catch (Invalid& invalid) {
    read.content = std::move(invalid.why);
  }
  return read;
}

}  // namespace Keelgate::CLI
