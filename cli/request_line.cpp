// SPDX-License-Identifier: Apache-2.0
/// Read as events and never as a tree: a line is as large as its message, and a tree of a hostile
/// id would be many times as large.
#include "cli/request_line.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include <charconv>

namespace Keelgate::CLI {

namespace {

using rapidjson::SizeType;

struct Members {
  Optional<String> record;
  Optional<String> service;
  /// The number as it was written.
  Optional<String> command;
  Optional<String> message;
  Optional<String> id;
};

struct Member {
  std::string_view key;
  Optional<String> Members::*value;
  /// The type that it must have; kNullType stands for any.
  rapidjson::Type type;
  std::string_view demand;
};

/// What a request may have, and nothing else.
constexpr Member memberTable[] = {
    {"record", &Members::record, rapidjson::kStringType, "a string"},
    {"service", &Members::service, rapidjson::kStringType, "a string"},
    {"command", &Members::command, rapidjson::kNumberType, "a number"},
    {"message", &Members::message, rapidjson::kStringType, "a string"},
    {"id", &Members::id, rapidjson::kNullType, "any value"},
};

/// Takes the reader's events: notes the members, copies the id, remembers the first thing wrong
/// and goes on, so that an id further down is still found.
class RequestReader : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, RequestReader> {
 public:
  bool Null() { return scalar("null", "null", rapidjson::kNullType); }
  bool Bool(bool value) {
    const std::string_view text = value ? "true" : "false";
    return scalar(text, text, rapidjson::kTrueType);
  }
  // Digit by digit as it was written: a double in between would change a command above 2^53.
  bool RawNumber(const char* text, SizeType size, bool) {
    return scalar({text, size}, {text, size}, rapidjson::kNumberType);
  }
  bool String(const char* text, SizeType size, bool) {
    const std::string_view value(text, size);
    if (!isText(value)) return false;
    // A message is as long as the line, and no copy of it in quotes is needed.
    const std::string_view json = inId() ? std::string_view(quotedText_ = jsonString(value)) : "";
    return scalar(value, json, rapidjson::kStringType);
  }
  bool StartObject() {
    // The request itself. Anything else at this depth is no object.
    if (depth_ == 0) return ++depth_ == 1;
    if (inId()) id_.StartObject();
    return open();
  }
  bool StartArray() {
    if (inId()) id_.StartArray();
    return open();
  }
  bool EndObject(SizeType) {
    if (inId()) id_.EndObject();
    return close();
  }
  bool EndArray(SizeType) {
    if (inId()) id_.EndArray();
    return close();
  }
  bool Key(const char* text, SizeType size, bool) {
    const std::string_view key(text, size);
    if (!isText(key)) return false;
    if (depth_ == 1) {
      select(key);
    } else if (inId()) {
      writeString(id_, key);
    }
    return true;
  }

  [[nodiscard]] const Members& members() const { return members_; }
  [[nodiscard]] const Keelgate::String& problem() const { return problem_; }
  [[nodiscard]] Optional<Keelgate::String> id() const {
    return idIsAmbiguous_ ? std::nullopt : members_.id;
  }

 private:
  [[nodiscard]] bool inId() const { return member_ != nullptr && member_->key == "id"; }

  void wrong(Keelgate::String problem) {
    // The first is the one that explains the others.
    if (problem_.empty()) problem_ = std::move(problem);
  }

  /// The reader lets an escaped half of a surrogate pair pass. Such a text, and so such an id,
  /// could not be written back.
  bool isText(std::string_view text) {
    if (isUtf8(text)) return true;
    wrong("a string holds half of a surrogate pair");
    return false;
  }

  void select(std::string_view key) {
    member_ = nullptr;
    for (const Member& member : memberTable) {
      if (member.key == key) member_ = &member;
    }
    if (member_ == nullptr) {
      wrong(fmt::format("unknown key {}", jsonString(key)));
    } else if (members_.*member_->value) {
      wrong(fmt::format("the key \"{}\" stands twice", key));
      // To echo either would be a guess, and the caller would take the reply for another's.
      if (inId()) idIsAmbiguous_ = true;
      member_ = nullptr;
    }
  }

  bool scalar(std::string_view value, std::string_view json, rapidjson::Type type) {
    if (depth_ == 0) return notAnObject();
    if (inId()) writeRaw(id_, json);
    if (depth_ == 1) finish(value, type);
    return true;
  }

  bool open() {
    if (depth_ == 0) return notAnObject();
    ++depth_;
    return true;
  }

  bool close() {
    if (--depth_ == 1) finish({}, rapidjson::kObjectType);
    return true;
  }

  /// A whole value of the request itself has been read.
  void finish(std::string_view value, rapidjson::Type type) {
    if (member_ == nullptr) return;
    if (inId()) {
      // Of any type: it is the caller's, and is handed back unread.
      members_.id = Keelgate::String(idText_.GetString(), idText_.GetSize());
    } else if (member_->type == type) {
      members_.*member_->value = Keelgate::String(value);
    } else {
      wrong(fmt::format("\"{}\" must be {}", member_->key, member_->demand));
    }
    member_ = nullptr;
  }

  bool notAnObject() {
    wrong("a request is a JSON object");
    return false;
  }

  Members members_;
  const Member* member_ = nullptr;
  std::size_t depth_ = 0;
  rapidjson::StringBuffer idText_;
  rapidjson::Writer<rapidjson::StringBuffer> id_{idText_};
  Keelgate::String quotedText_;
  Keelgate::String problem_;
  bool idIsAmbiguous_ = false;
};

/// Thrown and caught in this file: why a line is no request.
struct Invalid {
  String why;
};

void demand(bool holds, std::string_view otherwise) {
  if (!holds) throw Invalid{String(otherwise)};
}

Subject subjectOf(const Members& members) {
  if (members.record) {
    demand(!members.service && !members.command, "\"record\" excludes \"service\" and \"command\"");
    demand(isRecordName(*members.record),
           fmt::format("unknown record {}: one of {}", jsonString(*members.record),
                       fmt::join(recordNames(), ", ")));
    return *members.record;
  }
  demand(members.service || members.command, "neither \"record\" nor \"service\" is given");
  demand(members.service.has_value(), "\"command\" needs \"service\"");
  demand(members.command.has_value(), "\"service\" needs \"command\"");
  // JSON also has -1, 1.5 and 1e3, which are numbers and no commands.
  const Optional<UInt64> command = decimal(*members.command);
  demand(command.has_value(), "\"command\" must be an integer from 0 to 18446744073709551615");
  return VespClientMessageContext{.command = *command, .service = *members.service};
}

Request requestOf(const Members& members) {
  Subject subject = subjectOf(members);
  demand(members.message.has_value(), "\"message\" is missing");
  Optional<Data> message = fromBase64(*members.message);
  demand(message.has_value(), "\"message\" is no base64 with padding");
  return {.subject = std::move(subject), .message = std::move(*message)};
}

}  // namespace

Optional<UInt64> decimal(std::string_view text) {
  UInt64 number = 0;
  const char* end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, number);
  // All of the text or none: "12a" is no 12.
  if (error != std::errc() || rest != end) return std::nullopt;
  return number;
}

RequestLine readRequestLine(std::string_view line) {
  // Iterative, because recursion would let a nested id choose the depth of the stack.
  constexpr unsigned flags = rapidjson::kParseNumbersAsStringsFlag |
                             rapidjson::kParseValidateEncodingFlag | rapidjson::kParseIterativeFlag;
  rapidjson::MemoryStream stream(line.data(), line.size());
  rapidjson::Reader reader;
  RequestReader request;
  const rapidjson::ParseResult result = reader.Parse<flags>(stream, request);
  RequestLine read;
  try {
    if (result.IsError() && result.Code() != rapidjson::kParseErrorTermination) {
      demand(false, fmt::format("not readable as JSON: {} (at byte {})",
                                rapidjson::GetParseError_En(result.Code()), result.Offset()));
    }
    // The reader takes a null character for the end.
    if (!result.IsError())
      demand(stream.Tell() == line.size(), "not readable as JSON: a null character");
    // Only from a line that was read to its end: half an id is another one.
    if (!result.IsError()) read.id = request.id();
    demand(request.problem().empty(), request.problem());
    read.content = requestOf(request.members());
  } catch (Invalid& invalid) {
    read.content = std::move(invalid.why);
  }
  return read;
}

}  // namespace Keelgate::CLI
