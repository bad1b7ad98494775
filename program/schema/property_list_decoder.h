// SPDX-License-Identifier: Apache-2.0
/// Keyed decoding: from the bytes of a property list to a schema, or to the record that agrees with
/// one.
///
///     auto schema = PropertyListDecoder().decode<VespSampleMessageSchema>(from);
///     auto record = PropertyListDecoder().decode<VespSampleMessageSchema,
///     VespSampleMessage>(from);
///
/// The second never makes the schema: each field is decoded where the record has it, so that a
/// message of many records inside one another moves none of them and never holds both.
///
/// The whole document is checked before any field is read. Fields are read as if in declaration
/// order, and the first failure ends the decoding: what is thrown is a DecodingError (or what a
/// schema's own decoding throws), and nothing partial escapes. A plain field is required, an
/// Optional one may be missing or null; a value of the wrong type fails the message in both. Keys
/// that the schema does not have are ignored.
///
/// A decoder is used for one message and by one thread.
#pragma once

#include "framework/contracts/fields.h"
#include "plist/document.h"
#include "plist/expansion_budget.h"
#include "program/schema/coding_path.h"
#include "program/schema/decoding_errors.h"
#include "program/schema/fields_into.h"
#include "program/schema/key_table.h"
#include "program/schema/scalars.h"

#include <keelgate/describe.h>

#include <array>
#include <concepts>
#include <cstddef>
#include <utility>
#include <variant>

namespace VespKeelgateService {

class KeyedContainer;

/// A schema that cannot be decoded field by field says how it is decoded.
template <class S>
concept DecodesItself = requires(const KeyedContainer& container) {
  { S::decode(container) } -> std::same_as<S>;
};

/// What is decoded from a single value.
template <class T>
constexpr bool isScalar = !Keelgate::CaseKeyed<T> && !Keelgate::Schema<T> && !Keelgate::isArray<T>;

/// What the readers of one message share. Handed down by reference; lives as long as the decoding.
struct Decoding {
  PropertyList::ExpansionBudget budget;
  /// Whether fields are read type by type, with one call for each, or as declared.
  bool isByType = true;
};

/// A value that a schema describes as W. What is filled is a W, or what W fills.
template <class W, class T>
void decodeValue(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                 T& into);

/// A dictionary as the fields of a schema see it. Borrowed by the schemas that decode themselves.
class KeyedContainer {
 public:
  /// Throws typeMismatch for a value of another type. All of it is borrowed.
  KeyedContainer(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                 std::string_view schema)
      : decoding_(decoding), value_(value), path_(path) {
    using PropertyList::Type;
    if (value.type() != Type::dictionary) throw Errors::typeMismatch(path, schema, value.type());
  }

  /// Reads the value under a key. A search from the start: made for the few fields of a schema that
  /// decodes itself. Throws keyNotFound where it is missing, and valueNotFound where it is null.
  template <class T>
  [[nodiscard]] T decode(std::string_view key) const {
    for (const PropertyList::Entry entry : value_.entries()) {
      if (entry.key != key) continue;
      T decoded{};
      decodeValue<T>(decoding_, entry.value, CodingPath(path_, key), decoded);
      return decoded;
    }
    throw Errors::keyNotFound(path_, key);
  }

  /// The same for a field under the key that its schema gives it.
  template <Keelgate::Schema S, class T>
  [[nodiscard]] T decode(T S::*field) const {
    return decode<T>(S::CodingKeys::keyOf(field));
  }

  /// The dictionary, and where it stands.
  [[nodiscard]] const PropertyList::Value& value() const { return value_; }
  [[nodiscard]] const CodingPath& path() const { return path_; }

 private:
  Decoding& decoding_;
  const PropertyList::Value& value_;
  const CodingPath& path_;
};

/// The values of a dictionary, each at the place of its field in the order by type. Kept as bare
/// numbers: there is one of these on the stack for every nested payload.
template <Keelgate::Schema S>
class FieldValues {
 public:
  using Fields = Keelgate::FieldSet<S::CodingKeys::size>;

  /// Keys that no field has are passed over: a newer sender may know more of them.
  explicit FieldValues(const PropertyList::Value& dictionary) : dictionary_(dictionary) {
    typename Fields::Words words{};
    dictionary.find(knownKeys<S>, words.data(), numbers_.data());
    present_ = Fields(words);
  }

  [[nodiscard]] const Fields& present() const { return present_; }
  /// Of a field that is present.
  [[nodiscard]] PropertyList::Value at(std::size_t field) const {
    return dictionary_.child(numbers_[field]);
  }

 private:
  const PropertyList::Value& dictionary_;
  Fields present_;
  /// Unset where the field is absent.
  std::array<std::uint32_t, S::CodingKeys::size> numbers_;
};

/// By their places, too.
template <Keelgate::Schema S>
constexpr auto requiredFields = [] {
  Keelgate::FieldSet<S::CodingKeys::size> required;
  std::size_t position = 0;
  S::CodingKeys::each([&](auto field) {
    const std::size_t place = Keelgate::byType<S>.places[position++];
    if (!Keelgate::isOptional<typename decltype(field)::Value>) required.insert(place);
  });
  return required;
}();

/// The fields of one kind, into members of R. A function for each type of field and no code for
/// each field, so that a struct of 156 fields does not make a frame of 156 fields' temporaries:
/// payloads nest 256 deep, and a sealed worker's stack is small.
template <Keelgate::Schema S, class R>
struct FieldDecoder {
  using Values = FieldValues<S>;
  using Fields = typename Values::Fields;
  using Function = void (*)(const Fields&, Decoding&, const Values&, const CodingPath& outer, R&);

  template <class W, class V>
  static void into(const Fields& fields, Decoding& decoding, const Values& values,
                   const CodingPath& outer, R& record) {
    fields.each([&](std::size_t place) {
      const PropertyList::Value value = values.at(place);
      if (Keelgate::isOptional<W> && value.type() == PropertyList::Type::null) return;
      const std::size_t position = Keelgate::byType<S>.positions.data()[place];
      V& member = Places<R>::template at<V>(record, position);
      constexpr auto& keys = S::CodingKeys::keys;
      using Present = PresentOf<W>;
      if constexpr (isScalar<Present>) {
        const Scalars::Fault fault = Scalars::decode(decoding.budget, value, member);
        if (fault == Scalars::Fault::none) return;
        Scalars::refuse(fault, outer, keys[position], Scalars::expectation<Present>(),
                        value.type());
      } else if constexpr (Keelgate::isOptional<V>) {
        decodeValue<Present>(decoding, value, CodingPath(outer, keys[position]), member.emplace());
      } else {
        decodeValue<Present>(decoding, value, CodingPath(outer, keys[position]), member);
      }
    });
  }

 private:
  template <class W>
  static W presentOf(const Keelgate::Optional<W>*);
  template <class W>
  static W presentOf(const W*);
  template <class W>
  using PresentOf = decltype(presentOf(static_cast<const W*>(nullptr)));
};

template <Keelgate::Schema S, class R>
void decodeFields(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                  R& into) {
  constexpr auto& decoders = decodersOf<S, R, FieldDecoder<S, R>>;
  constexpr std::size_t size = S::CodingKeys::size;
  static_assert(decoders.misfit == size,
                "a field of the record cannot hold what the schema's field does");
  constexpr auto& functions = Keelgate::trimmed<decoders>;
  const FieldValues<S> values(value);
  if (decoding.isByType && values.present().firstMissing(requiredFields<S>) == size) {
    return callEach(functions, values.present(), decoding, values, path, into);
  }
  // What stands before the first field that is missing may be wrong, too.
  for (std::size_t position = 0; position < size; ++position) {
    const std::size_t place = Keelgate::byType<S>.places.data()[position];
    if (values.present().contains(place)) {
      typename FieldValues<S>::Fields one;
      one.insert(place);
      callEach(functions, one, decoding, values, path, into);
    } else if (requiredFields<S>.contains(place)) {
      throw Errors::keyNotFound(path, S::CodingKeys::keys[position]);
    }
  }
}

template <Keelgate::Schema S, class R>
void decodeSchema(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                  R& into) {
  const KeyedContainer container(decoding, value, path, Keelgate::typeName<S>());
  // The attack: one dictionary with a million keys that no field takes, named by a thousand array
  // elements. Nothing is made from its entries, but all are looked at each time.
  decoding.budget.spend(value, value.count() * sizeof(PropertyList::Entry));
  if constexpr (DecodesItself<S>) {
    into = S::decode(container);
  } else {
    decodeFields<S>(decoding, value, path, into);
  }
}

template <class W, class T>
void decodeArray(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                 Keelgate::Array<T>& into) {
  using PropertyList::Type;
  if (value.type() != Type::array) throw Errors::typeMismatch(path, "an array", value.type());
  // Before the memory is reserved: a shared element costs its message a byte for each reference.
  for (const PropertyList::Value element : value.elements()) {
    decoding.budget.spend(element, sizeof(T));
  }
  into.reserve(value.count());
  std::size_t index = 0;
  for (const PropertyList::Value element : value.elements()) {
    decodeValue<W>(decoding, element, CodingPath(path, index++), into.emplace_back());
  }
}

/// The case-keyed form of an enumeration: {case: {"_0": payload}}, and no other key beside the
/// case.
template <Keelgate::CaseKeyed T, std::size_t... i>
void decodeCase(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                T& into, std::index_sequence<i...>) {
  const KeyedContainer container(decoding, value, path, Keelgate::typeName<T>());
  decoding.budget.spend(value, sizeof(T));
  // With two, the order in the dictionary would choose the case.
  if (value.count() != 1) throw Errors::notOneKey(path);
  const PropertyList::Entry entry = *value.entries().begin();
  const CodingPath inner(path, entry.key);
  const auto decodeAs = [&]<std::size_t which>() {
    using Payload = std::variant_alternative_t<which, typename T::variant>;
    const KeyedContainer nested(decoding, entry.value, inner, T::caseNames[which]);
    into.template emplace<which>(nested.template decode<Payload>("_0"));
    return true;
  };
  const bool named = ((T::caseNames[i] == entry.key && decodeAs.template operator()<i>()) || ...);
  if (!named) throw Errors::notOneKey(path);
}

template <class W, class T>
void decodeValue(Decoding& decoding, const PropertyList::Value& value, const CodingPath& path,
                 T& into) {
  if constexpr (isScalar<W>) {
    const Scalars::Fault fault = Scalars::decode(decoding.budget, value, into);
    if (fault == Scalars::Fault::none) return;
    Scalars::refuse(fault, path, Scalars::expectation<W>(), value.type());
  } else if (value.type() == PropertyList::Type::null) {
    throw Errors::valueNotFound(path, Scalars::expectation<W>());
  } else if constexpr (Keelgate::CaseKeyed<W>) {
    decodeCase(decoding, value, path, into,
               std::make_index_sequence<std::variant_size_v<typename W::variant>>());
  } else if constexpr (Keelgate::Schema<W>) {
    decodeSchema<W>(decoding, value, path, into);
  } else {
    decodeArray<typename W::value_type>(decoding, value, path, into);
  }
}

/// Has no settings and keeps nothing.
class PropertyListDecoder {
 public:
  /// Throws DecodingError and std::bad_alloc. What is given owns all that it holds: the bytes may
  /// go. No constructor of a record has been asked yet: that is for the unpacker, in its order.
  template <Keelgate::Schema S, class R = S>
  [[nodiscard]] R decode(Keelgate::Bytes from) {
    R decoded{};
    read(from, knownKeys<S>, [&](Decoding& decoding, const PropertyList::Value& top) {
      const PropertyList::ExpansionBudget budget = decoding.budget;
      try {
        return decodeSchema<S>(decoding, top, CodingPath(), decoded);
      } catch (...) {  // NOLINT(bugprone-empty-catch)
        // Deliberate: dropped, because the same fault is met again below, or one that comes first.
      }
      // The same faults give the same error, whatever the order in the message or by type: the one
      // that comes first as declared.
      decoding = {.budget = budget, .isByType = false};
      decoded = R{};
      decodeSchema<S>(decoding, top, CodingPath(), decoded);
    });
    return decoded;
  }

  /// Calls `body(decoding, top)` with the checked document's top value, which lives as long as the
  /// call. The known keys are those of the schema that most of it has, if any. What it throws comes
  /// through, and a message without a sound document as DecodingError.
  template <class Body>
  void read(Keelgate::Bytes from, const PropertyList::KnownKeys& known, Body&& body) {
    try {
      const PropertyList::Document document(from, known);
      Decoding decoding{.budget = PropertyList::ExpansionBudget(from.size())};
      body(decoding, document.top());
    } catch (const PropertyList::MalformedDocument& error) {
      // From the check of the document, or from the budget while fields are read.
      throw Errors::malformed(error, from);
    }
  }
};

}  // namespace VespKeelgateService
