// SPDX-License-Identifier: Apache-2.0
/// Whoever reads the output takes it for well-formed JSON that cannot move a cursor. Both are
/// decided here, character by character.
#include "framework/json/writer.h"

#include "text/base64.h"
#include "text/utf8.h"

#include <keelgate/errors.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <numeric>
#include <utility>

namespace Keelgate::JSON {

namespace {

/// Large enough that pieces cost nothing beside their text; a longer value is put in parts, so no
/// piece is much longer. Budgets are looked at for every piece.
constexpr std::size_t pieceSize = std::size_t{64} << 10;

/// Most replies fit.
constexpr std::size_t usualSize = 4096;

/// A whole number of groups of three bytes, so that the parts of a value join without padding.
constexpr std::size_t base64Part = pieceSize / 4 * 3;

/// Whether an ASCII character stands for itself in a string.
constexpr std::array<bool, 256> plain = [] {
  std::array<bool, 256> table{};
  for (std::size_t c = 0x20; c < 0x7f; ++c) table[c] = c != '"' && c != '\\';
  return table;
}();

std::size_t plainLength(std::string_view text) {
  const auto special =
      std::ranges::find_if_not(text, [](char c) { return plain[static_cast<unsigned char>(c)]; });
  return static_cast<std::size_t>(special - text.begin());
}

/// The short escapes are those that people expect to see.
char shortEscape(char32_t c) {
  switch (c) {
    case '"':
    case '\\':
      return static_cast<char>(c);
    case '\n':
      return 'n';
    case '\r':
      return 'r';
    case '\t':
      return 't';
    default:
      return '\0';
  }
}

template <class T>
std::string_view decimal(std::array<char, 32>& to, T value) {
  const auto end = std::to_chars(to.data(), to.data() + to.size(), value).ptr;
  return {to.data(), static_cast<std::size_t>(end - to.data())};
}

}  // namespace

std::size_t sizeOf(const Pieces& pieces) {
  return std::accumulate(pieces.begin(), pieces.end(), std::size_t{0},
                         [](std::size_t sum, const String& piece) { return sum + piece.size(); });
}

void Writer::key(std::string_view name) {
  separate();
  quoted(name);
  put(layout_ == Layout::pretty ? ": " : ":");
  afterKey_ = true;
}

void Writer::label(std::string_view name) {
  separate();
  piece_ += '"';
  piece_ += name;
  piece_ += layout_ == Layout::pretty ? "\": " : "\":";
  afterKey_ = true;
}

void Writer::string(std::string_view text) {
  separate();
  quoted(text);
}

void Writer::integer(Int64 value) {
  std::array<char, 32> text;
  raw(decimal(text, value));
}

void Writer::integer(UInt64 value) {
  std::array<char, 32> text;
  raw(decimal(text, value));
}

void Writer::number(Double value) {
  if (std::isnan(value)) return string("nan");
  if (std::isinf(value)) return string(value > 0 ? "inf" : "-inf");
  // Digits as people write them, where that takes no more than a double has of them.
  const double size = std::abs(value);
  const Bool fixed = size == 0 || (size >= 1e-5 && size < 1e16);
  std::array<char, 32> text;
  char* end = std::to_chars(text.data(), text.data() + text.size(), value,
                            fixed ? std::chars_format::fixed : std::chars_format::scientific)
                  .ptr;
  const std::string_view digits(text.data(), static_cast<std::size_t>(end - text.data()));
  raw(digits);
  // Else a reader that tells integers from fractions would take 3.0 for an integer.
  if (digits.find_first_of(".e") == std::string_view::npos) put(".0");
}

void Writer::data(Bytes bytes) {
  separate();
  put("\"");
  while (!bytes.empty()) {
    const Bytes part = bytes.first(std::min(base64Part, bytes.size()));
    const std::size_t begin = piece_.size();
    piece_.resize(begin + Text::base64Length(part.size()));
    Text::encodeBase64(part, piece_.data() + begin);
    if (piece_.size() >= pieceSize) next();
    bytes = bytes.subspan(part.size());
  }
  put("\"");
}

void Writer::raw(std::string_view json) {
  separate();
  put(json);
}

Pieces Writer::take() && {
  put("\n");
  next();
  return std::move(pieces_);
}

void Writer::begin(char bracket) {
  separate();
  if (depth_ == 0) piece_.reserve(usualSize);
  put({&bracket, 1});
  ++depth_;
  empty_ = true;
}

void Writer::end(char bracket) {
  --depth_;
  if (!empty_) newLine();
  put({&bracket, 1});
  empty_ = false;
}

void Writer::separate() {
  if (std::exchange(afterKey_, false) || depth_ == 0) return;
  if (!std::exchange(empty_, false)) put(",");
  newLine();
}

void Writer::newLine() {
  if (layout_ != Layout::pretty) return;
  piece_ += '\n';
  piece_.append(2 * depth_, ' ');
  if (piece_.size() >= pieceSize) next();
}

void Writer::quoted(std::string_view text) {
  put("\"");
  while (!text.empty()) {
    const std::size_t length = std::min(plainLength(text.substr(0, pieceSize)), text.size());
    put(text.substr(0, length));
    text.remove_prefix(length);
    if (length < pieceSize && !text.empty()) quotedCharacter(text);
  }
  put("\"");
}

void Writer::quotedCharacter(std::string_view& text) {
  auto [character, length] = Text::firstCharacter(text);
  // One escape for each byte that begins no character.
  if (length == 0) character = 0xdc00 + static_cast<unsigned char>(text.front());
  const std::size_t consumed = std::max<std::size_t>(length, 1);
  // Of ASCII only controls come here, beside those that have a letter.
  const Bool control = character < 0xa0;
  const Bool lineEnd = character == 0x2028 || character == 0x2029;
  if (const char letter = shortEscape(character); letter != '\0') {
    const char escape[] = {'\\', letter};
    put({escape, sizeof escape});
  } else if (control || lineEnd || length == 0) {
    // All of these are in the basic plane, so four digits do.
    constexpr const char* digits = "0123456789abcdef";
    const char escape[] = {'\\',
                           'u',
                           digits[character >> 12],
                           digits[character >> 8 & 15],
                           digits[character >> 4 & 15],
                           digits[character & 15]};
    put({escape, sizeof escape});
  } else {
    put(text.substr(0, length));
  }
  text.remove_prefix(consumed);
}

void Writer::put(std::string_view text) {
  piece_ += text;
  if (piece_.size() >= pieceSize) next();
}

void Writer::next() {
  written_ += piece_.size();
  if (written_ > budget_.bytes) {
    throw HostError(HostError::Reason::resourcesExhausted,
                    "the reply has more than the " + std::to_string(budget_.bytes) +
                        " bytes of JSON that a message of this size may have");
  }
  if (std::chrono::steady_clock::now() > budget_.deadline) {
    throw HostError(HostError::Reason::timedOut, "the reply as JSON was not ready in time");
  }
  if (layout_ == Layout::discarded) {
    piece_.clear();
    return;
  }
  pieces_.push_back(std::move(piece_));
  piece_ = String();
}

String quote(std::string_view text) {
  Writer out(Layout::compact);
  out.string(text);
  String all;
  for (const String& piece : std::move(out).take()) all += piece;
  all.pop_back();
  return all;
}

String withoutControls(std::string_view text) {
  String all;
  for (;;) {
    const std::size_t end = std::min(text.find_first_of("\"\\"), text.size());
    const std::string_view part = text.substr(0, end);
    if (plainLength(part) == end) {
      all += part;
    } else {
      const String json = quote(part);
      all.append(json, 1, json.size() - 2);
    }
    if (end == text.size()) return all;
    all += text[end];
    text.remove_prefix(end + 1);
  }
}

}  // namespace Keelgate::JSON
