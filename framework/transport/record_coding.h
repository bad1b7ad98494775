// SPDX-License-Identifier: Apache-2.0
/// Records as the bytes of a reply, both ways, walked from their one description.
///
/// Written: integers and floating-point numbers as their 8 bytes, a boolean as a byte, text and
/// octets behind their length, an array behind its count, an enumeration as its raw value, a
/// case-keyed one as the case's position and then its record. A record that may lack a field begins
/// with a bit for each field, in words of 8 bytes, the first field lowest; then come the fields
/// that are there. Both in the order by type, in which they are read in two thirds of the time. An
/// optional without a value is not there, nor is an empty list.
///
/// Pure functions; callable from any thread. Writing throws std::bad_alloc alone.
#pragma once

#include "framework/contracts/construct.h"
#include "framework/contracts/fields.h"
#include "framework/transport/wire.h"

#include <keelgate/describe.h>
#include <keelgate/records/property_list.h>

#include <bit>
#include <cmath>
#include <cstddef>
#include <utility>
#include <variant>

namespace Keelgate::Transport {

// ---------------------------------------------------------------------------------- writing

// Declared before its special cases: they and it call one another.
template <class T>
void write(Writer& to, const T& value);

/// Whether a field may be absent.
template <class V>
constexpr bool mayLack = isOptional<V> || isArray<V>;

/// The fields that every record of the type has.
template <class T>
constexpr auto requiredFields = [] {
  FieldSet<FieldsOf<T>::size> required;
  std::size_t position = 0;
  FieldsOf<T>::each([&]<class S, class V>(Field<S, V>) {
    if (!mayLack<V>) required.insert(byType<T>.places[position]);
    ++position;
  });
  return required;
}();
template <class T>
constexpr auto allFields = [] {
  FieldSet<FieldsOf<T>::size> all;
  for (std::size_t i = 0; i < FieldsOf<T>::size; ++i) all.insert(i);
  return all;
}();

/// The fields that are there. Nothing is written of it where none may be absent.
template <class T>
constexpr std::size_t presenceWords = requiredFields<T>.words() == allFields<T>.words()
                                          ? 0
                                          : allFields<T>.words().size();

template <class T>
FieldSet<FieldsOf<T>::size> presentIn(const T& record) {
  typename FieldSet<FieldsOf<T>::size>::Words words{};
  std::size_t n = 0;
  FieldsOf<T>::eachValue(
      record, [&]<class V>(const V& value) __attribute__((always_inline)) {
        bool isPresent = true;
        if constexpr (isOptional<V>) isPresent = value.has_value();
        if constexpr (isArray<V>) isPresent = !value.empty();
        const std::size_t place = byType<T>.places.data()[n++];
        words[place / 64] |= std::uint64_t{isPresent} << place % 64;
      });
  return FieldSet<FieldsOf<T>::size>(words);
}

/// The functions for the fields of T by their types: `Coding::template fields<V>`.
template <class T, class Coding>
constexpr auto codingsOf = [] {
  FieldFunctions<typename Coding::Function, FieldsOf<T>::size> functions;
  std::size_t position = 0;
  FieldsOf<T>::each([&]<class V>(Field<T, V>) {
    functions.insert(firstOf<T, V>, Coding::template fields<V>, byType<T>.places[position++]);
  });
  return functions;
}();

template <class T>
struct Writing {
  using Fields = FieldSet<FieldsOf<T>::size>;
  using Function = void (*)(const Fields&, Writer& to, const T& record);
  template <class V>
  static void fields(const Fields& fields, Writer& to, const T& record) {
    fields.each([&](std::size_t place) {
      const V& member = record.*membersOf<T, V>.data()[byType<T>.positions.data()[place]];
      if constexpr (isOptional<V>) {
        write(to, *member);
      } else {
        write(to, member);
      }
    });
  }
};

template <class T>
void writeRecord(Writer& to, const T& record) {
  const auto present = presentIn(record);
  for (std::size_t i = 0; i < presenceWords<T>; ++i) to.word(present.words()[i]);
  callEach(trimmed<codingsOf<T, Writing<T>>>, present, to, record);
}

/// Behind its count, which the reader holds against the bytes that follow.
template <class T>
requires(isArray<Array<T>>) void write(Writer& to, const Array<T>& values) {
  to.word(values.size());
  for (const T& value : values) write(to, value);
}

template <class T>
void write(Writer& to, const T& value) {
  if constexpr (std::same_as<T, std::nullptr_t>) {
    // Its case says it all.
  } else if constexpr (std::same_as<T, Bool>) {
    to.byte(value ? 1 : 0);
  } else if constexpr (std::integral<T> || Enumeration<T>) {
    to.word(static_cast<std::uint64_t>(value));
  } else if constexpr (std::same_as<T, Double>) {
    to.word(std::bit_cast<std::uint64_t>(value));
  } else if constexpr (std::same_as<T, Date>) {
    to.word(std::bit_cast<std::uint64_t>(value.secondsSinceReferenceDate));
  } else if constexpr (std::same_as<T, UUID>) {
    for (std::uint8_t octet : value.octets) to.byte(octet);
  } else if constexpr (std::same_as<T, String>) {
    to.text(value);
  } else if constexpr (std::same_as<T, Data>) {
    to.octets(value);
  } else if constexpr (CaseKeyed<T>) {
    // A byte is enough: the largest of these enumerations has twelve cases.
    to.byte(static_cast<std::uint8_t>(value.index()));
    std::visit([&](const auto& payload) { write(to, payload); }, value);
  } else {
    writeRecord(to, value);
  }
}

// ---------------------------------------------------------------------------------- reading

/// How many containers an array of such values takes at each level: itself, and around the fields
/// of a record their dictionary.
template <class T>
constexpr int containersOf = Record<T> && !std::same_as<T, PropertyListEntry> ? 2 : 1;

/// The fewest bytes that a value is written as: a count is held against them before room is made.
template <class T>
constexpr std::size_t smallestSize() {
  if constexpr (std::same_as<T, Bool> || CaseKeyed<T>) {
    return 1;
  } else if constexpr (std::same_as<T, UUID>) {
    return sizeof(T);
  } else if constexpr (Record<T>) {
    std::size_t sum = presenceWords<T> * sizeof(std::uint64_t);
    FieldsOf<T>::each([&]<class S, class Value>(Field<S, Value>) {
      if constexpr (!mayLack<Value>) sum += smallestSize<Value>();
    });
    return sum;
  } else {
    return sizeof(std::uint64_t);
  }
}

template <class T>
void read(Reader& from, T& value, int depth);

template <class T>
requires(isArray<Array<T>>) void read(Reader& from, Array<T>& values, int depth) {
  const std::size_t count = from.count(smallestSize<T>());
  if (count == 0) return;
  // Only through an array can a value hold another of its own kind.
  const int inside = depth + containersOf<T>;
  if (inside > maximumNesting) throw MalformedReply();
  // In one block, which is charged before it is there: a list that grows holds two of them.
  from.charge(count * sizeof(T));
  values.reserve(count);
  // Made in place: a temporary payload takes 4 KB of stack at every level of nesting, and the
  // application may call from a thread with little.
  for (std::size_t i = 0; i < count; ++i) read(from, values.emplace_back(), inside);
}

/// The case that the byte names; a byte that names none is refused.
template <class T, std::size_t... i>
void readCase(Reader& from, T& value, int depth, std::index_sequence<i...>) {
  const std::size_t which = from.byte();
  const bool known =
      ((which == i ? (read(from, value.template emplace<i>(), depth), true) : false) || ...);
  if (!known) throw MalformedReply();
}

template <class T>
struct Reading {
  using Fields = FieldSet<FieldsOf<T>::size>;
  using Function = void (*)(const Fields&, Reader& from, T& record, int depth);
  template <class V>
  static void fields(const Fields& fields, Reader& from, T& record, int depth) {
    fields.each([&](std::size_t place) {
      V& member = record.*membersOf<T, V>.data()[byType<T>.positions.data()[place]];
      if constexpr (std::same_as<V, Optional<String>>) {
        // Made where it stays.
        member.emplace(from.text());
      } else if constexpr (isOptional<V>) {
        read(from, member.emplace(), depth);
      } else {
        read(from, member, depth);
      }
      // A second spelling of the same record, too.
      if constexpr (isArray<V>) {
        if (member.empty()) throw MalformedReply();
      }
    });
  }
};

template <class T>
void readRecord(Reader& from, T& value, int depth) {
  static_assert(T::Labels::isComplete(), "a member of the record is not in its list of fields");
  static_assert(T::Labels::keys == T::Labels::names, "a field of the record has a wire key");
  constexpr std::size_t size = FieldsOf<T>::size;
  auto words = allFields<T>.words();
  for (std::size_t i = 0; i < presenceWords<T>; ++i) words[i] = from.word();
  const FieldSet<size> present(words);
  // A bit that no field has is a second spelling of the same record.
  const bool isSpeltOtherwise = (words.back() & ~allFields<T>.words().back()) != 0;
  if (isSpeltOtherwise || present.firstMissing(requiredFields<T>) < size) throw MalformedReply();
  callEach(trimmed<codingsOf<T, Reading<T>>>, present, from, value, depth);
  // What the framework refuses in the service is refused here too.
  constructInPlace(value);
}

template <class T>
void read(Reader& from, T& value, int depth) {
  if constexpr (std::same_as<T, std::nullptr_t>) {
    value = nullptr;
  } else if constexpr (std::same_as<T, Bool>) {
    value = from.flag();
  } else if constexpr (std::integral<T>) {
    value = static_cast<T>(from.word());
  } else if constexpr (Enumeration<T>) {
    // A number that is not a case would run past the end of the first switch that meets it.
    const Optional<T> known = fromRawValue<T>(from.word());
    if (!known) throw MalformedReply();
    value = *known;
  } else if constexpr (std::same_as<T, Double>) {
    value = std::bit_cast<double>(from.word());
  } else if constexpr (std::same_as<T, Date>) {
    // A date is finite by its own promise, which its reader may rely on.
    value.secondsSinceReferenceDate = std::bit_cast<double>(from.word());
    if (!std::isfinite(value.secondsSinceReferenceDate)) throw MalformedReply();
  } else if constexpr (std::same_as<T, UUID>) {
    for (std::uint8_t& octet : value.octets) octet = from.byte();
  } else if constexpr (std::same_as<T, String>) {
    value = String(from.text());
  } else if constexpr (std::same_as<T, Data>) {
    value = from.octets();
  } else if constexpr (CaseKeyed<T>) {
    readCase(from, value, depth,
             std::make_index_sequence<std::variant_size_v<typename T::variant>>());
  } else {
    readRecord(from, value, depth);
  }
}

/// The body of a record frame, which borrows from the record. For the service. Throws
/// std::bad_alloc.
template <Record T>
Body lendRecord(const T& record) {
  Writer to;
  write(to, record);
  return std::move(to).take();
}

/// The record that a body holds. Throws MalformedReply, ReadLimitReached, std::bad_alloc, or what
/// the record's constructor throws.
/// For the client. What it gives is a record that an honest service might have sent: whether this
/// one did is not to be known.
template <Record T>
T decodeRecord(Bytes body, const ReadLimits& limits = {}) {
  Reader from(body, limits);
  T record{};
  read(from, record, 0);
  // Bytes behind the record: then it was not written by an honest service.
  from.end();
  return record;
}

}  // namespace Keelgate::Transport
