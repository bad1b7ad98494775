// SPDX-License-Identifier: Apache-2.0
/// JSON text, made once and within a budget.
///
///     Writer out(Layout::compact, {.bytes = 1 << 20});
///     out.beginObject();
///     out.key("record");
///     out.string("VespInvitation");
///     out.endObject();
///     for (const String& piece : std::move(out).take()) print(piece);
///
/// The attack: a few bytes of a message can stand for megabytes of text (control characters become
/// six characters each, a shared value stands as often as it is referred to), and the process that
/// makes the text holds everybody else's messages too. So the text has a bound in bytes and in
/// time, and is kept in pieces that are never copied to grow.
///
/// One thread at a time for each Writer. Throws HostError (resourcesExhausted, timedOut) when the
/// budget is spent, and std::bad_alloc.
#pragma once

#include <keelgate/values.h>

#include <chrono>
#include <cstddef>
#include <limits>
#include <string_view>

namespace Keelgate::JSON {

enum class Layout : std::uint8_t {
  /// On one line, for programs.
  compact,
  /// Indented by two spaces for each level, for people.
  pretty,
  /// Made and charged as compact text is, and not kept.
  discarded,
};

/// What the text of one message may cost.
struct Budget {
  std::size_t bytes = std::numeric_limits<std::size_t>::max();
  std::chrono::steady_clock::time_point deadline = std::chrono::steady_clock::time_point::max();
};

/// In the order in which the pieces are printed.
using Pieces = Array<String>;

std::size_t sizeOf(const Pieces& pieces);

class Writer {
 public:
  explicit Writer(Layout layout, Budget budget = {}) : layout_(layout), budget_(budget) {}

  void beginObject() { begin('{'); }
  void endObject() { end('}'); }
  void beginArray() { begin('['); }
  void endArray() { end(']'); }
  /// The key of the object's next value.
  void key(std::string_view name);
  /// The same for one that is known to have nothing to escape in it.
  void label(std::string_view name);

  /// Control characters are escaped up to U+009F and not only up to U+001F: a message must not be
  /// able to drive the terminal that its record is printed on. So are U+2028 and U+2029: many
  /// languages split lines there, and a reply is one line. A byte that is not UTF-8, which only a
  /// path can hold, becomes the escape of U+DC00 plus its value, as Python reads it back.
  void string(std::string_view text);
  void integer(Int64 value);
  void integer(UInt64 value);
  /// The shortest text that reads back to the same value, always with a fraction or an exponent;
  /// "nan", "inf" and "-inf" as strings, since JSON has no such numbers.
  void number(Double value);
  /// Base64 with padding.
  void data(Bytes bytes);
  /// A value whose JSON text is ready, such as `true`.
  void raw(std::string_view json);

  /// The text, with a newline behind it. The Writer is of no more use.
  [[nodiscard]] Pieces take() &&;

 private:
  void begin(char bracket);
  void end(char bracket);
  /// What stands between the value before and the one that comes.
  void separate();
  void newLine();
  void quoted(std::string_view text);
  void quotedCharacter(std::string_view& text);
  void put(std::string_view text);
  /// Closes the piece and charges it.
  void next();

  Layout layout_;
  Budget budget_;
  Pieces pieces_;
  String piece_;
  /// Of the pieces that are closed, in bytes.
  std::size_t written_ = 0;
  std::size_t depth_ = 0;
  /// Nothing stands yet in the object or array that is open.
  Bool empty_ = true;
  Bool afterKey_ = false;
};

/// `text` as a JSON string.
String quote(std::string_view text);

/// `text` with the characters escaped that a terminal would obey, or a reader of lines, as in a
/// JSON string. Quotes and backslashes stay: what was JSON is that still, and says the same.
String withoutControls(std::string_view text);

}  // namespace Keelgate::JSON
