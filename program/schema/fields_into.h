// SPDX-License-Identifier: Apache-2.0
/// Where the fields of a schema go: to the members of a record that agree with it, or to the
/// schema's own.
///
/// The two lists are compared at compile time, position by position: they have the same length and
/// the same names in the same order, and each member can hold what the schema's field says. A field
/// that moved, went missing or changed its type does not compile.
///
/// Constants and pure functions; callable from any thread.
#pragma once

#include "framework/contracts/fields.h"

#include <keelgate/describe.h>

#include <algorithm>
#include <concepts>
#include <cstddef>

namespace VespKeelgateService {

/// The position of the first field that has another name in the other list, or the length: in an
/// error the compiler prints it. Also for their order: swapped fields would be filled crosswise.
template <class S, class R>
consteval std::size_t firstOtherName() {
  constexpr auto& names = Keelgate::FieldsOf<S>::names;
  const auto other = std::ranges::mismatch(names, Keelgate::FieldsOf<R>::names).in1;
  return static_cast<std::size_t>(other - names.begin());
}

/// Whether a value that a schema describes as From can be decoded into a To: into the same, or into
/// a record that agrees with the schema.
template <class From, class To>
constexpr bool fills = std::same_as<From, To>;
template <Keelgate::Schema From, Keelgate::Record To>
constexpr bool fills<From, To> = std::ranges::equal(Keelgate::FieldsOf<From>::names,
                                                    Keelgate::FieldsOf<To>::names);
/// Absent stays absent: a missing dictionary becomes no record, an empty one becomes a record.
template <class From, class To>
constexpr bool fills<Keelgate::Optional<From>, Keelgate::Optional<To>> = fills<From, To>;
template <class From, class To>
constexpr bool fills<Keelgate::Array<From>, Keelgate::Array<To>> = fills<From, To>;
/// Deliberate: the record cannot tell an absent list from an empty one.
template <class From, class To>
constexpr bool fills<Keelgate::Optional<Keelgate::Array<From>>, Keelgate::Array<To>> =
    fills<From, To>;

using Keelgate::membersOf;

/// Where the fields of an R's list are: in its own members. Specialised for who keeps some of them
/// elsewhere.
template <class R>
struct Places {
  using Listed = R;
  template <class V>
  static V& at(R& record, std::size_t position) {
    return record.*membersOf<R, V>[position];
  }
};

/// For each kind of fields of a schema the function that decodes them.
template <class Function, std::size_t size>
struct Decoders : Keelgate::FieldFunctions<Function, size> {
  /// The position of a member that cannot hold what its field does, or `size`.
  std::size_t misfit = size;
};

/// Into the place in R at the position of the field of S. `Decode` gives, as `Decode::template
/// into<W, V>`, the function for fields of type W and members of type V.
template <Keelgate::Schema S, class R, class Decode>
constexpr auto decodersOf = [] {
  using From = Keelgate::FieldsOf<S>;
  using Listed = typename Places<R>::Listed;
  using To = Keelgate::FieldsOf<Listed>;
  static_assert(From::size == To::size,
                "the schema and the record have different numbers of fields");
  Decoders<typename Decode::Function, From::size> decoders;
  if constexpr (From::size == To::size) {
    static_assert(firstOtherName<S, Listed>() == From::size,
                  "a field of the record has another name than the schema's field at its position");
    std::size_t position = 0;
    From::each([&]<class W>(Keelgate::Field<S, W>) {
      To::at(position, [&]<class V>(Keelgate::Field<Listed, V>) {
        if constexpr (fills<W, V>) {
          constexpr std::size_t kind =
              Keelgate::firstOf<S, W> * From::size + Keelgate::firstOf<Listed, V>;
          decoders.insert(kind, Decode::template into<W, V>, Keelgate::byType<S>.places[position]);
        } else {
          decoders.misfit = position;
        }
      });
      ++position;
    });
  }
  return decoders;
}();

}  // namespace VespKeelgateService
