// SPDX-License-Identifier: Apache-2.0
/// Messages made from the field tables and from a fuzzer's choices: mostly what a schema asks for,
/// now and then what it does not. A field that a schema gains is in them by itself.
///
/// Pure but for the Choices, which belong to one thread.
#pragma once

#include "fuzz/messages/choices.h"
#include "plist/tree.h"
#include "program/service/tables.h"
#include "text/uuid.h"

#include <keelgate/describe.h>
#include <keelgate/records.h>

#include <bit>
#include <cmath>
#include <limits>
#include <string>
#include <utility>
#include <vector>

namespace Keelgate::Fuzz {

using ::PropertyList::Tree;

/// A place that a message can be sent to.
struct Target {
  std::size_t record;
  std::string service;
  std::uint64_t command = 0;
  /// Of the schema that is decoded there.
  Tree (*message)(Choices&);
};

/// Any value at all.
inline Tree anything(Choices& choices, int depth) {
  switch (choices.below(depth < 6 ? 14 : 10)) {
    case 0:
      return true;
    case 1:
      return choices.number();
    case 2:
      return static_cast<std::int64_t>(choices.number());
    case 3: {
      const double number = std::bit_cast<double>(choices.number());
      return std::isnan(number) ? std::numeric_limits<double>::quiet_NaN() : number;
    }
    case 4:
      return ::PropertyList::Date{static_cast<double>(choices.number() >> 30)};
    case 5:
      return ::PropertyList::Data(choices.below(70), std::byte{choices.byte()});
    case 6:
      return choices.rarely(2) ? Tree(nullptr) : Tree(::PropertyList::Uid{choices.number()});
    case 7:
      return "";
    case 8:
    case 9:
      return choices.text();
    case 10: {
      ::PropertyList::Set set;
      for (std::size_t n = choices.below(4); n > 0; --n) {
        set.elements.push_back(anything(choices, depth + 1));
      }
      return set;
    }
    case 11: {
      ::PropertyList::Array array;
      for (std::size_t n = choices.below(20); n > 0; --n) {
        array.push_back(anything(choices, depth + 1));
      }
      return array;
    }
    default: {
      ::PropertyList::Dictionary entries;
      for (std::size_t n = choices.below(20); n > 0; --n) {
        std::string key = choices.text();
        entries.emplace_back(std::move(key), anything(choices, depth + 1));
      }
      return entries;
    }
  }
}

template <class T>
Tree valueFor(Choices& choices, int depth);

template <Schema S>
Tree dictionaryFor(Choices& choices, int depth) {
  ::PropertyList::Dictionary entries;
  // Most fields or few, so that long messages and short ones are both made.
  const std::size_t often = choices.rarely(4) ? 2 : 16;
  S::CodingKeys::each([&](auto field) {
    using Value = typename decltype(field)::Value;
    const bool isLeftOut = isOptional<Value> ? choices.below(often) == 0 : choices.rarely(64);
    if (!isLeftOut) entries.emplace_back(field.key, valueFor<Value>(choices, depth));
  });
  if (choices.rarely(16)) entries.emplace_back(choices.text(), anything(choices, depth));
  if (!entries.empty() && choices.rarely(64)) entries.push_back(entries.front());
  return entries;
}

/// What an alternative looks like on the wire.
template <CaseKeyed T>
Tree alternativeFor(Choices& choices, std::size_t which, int depth) {
  Tree tree = nullptr;
  [&]<std::size_t... i>(std::index_sequence<i...>) {
    const auto take = [&]<class Case>(std::type_identity<Case>) {
      tree = valueFor<Case>(choices, depth);
      return true;
    };
    static_cast<void>(
        ((which == i &&
          take(std::type_identity<std::variant_alternative_t<i, typename T::variant>>())) ||
         ...));
  }
  (std::make_index_sequence<std::variant_size_v<typename T::variant>>());
  return tree;
}

/// The one schema that says itself what another of its values is.
inline Tree invitationContext(Choices& choices, int depth) {
  static constexpr const char* names[] = {"com.tessen.Vesp.schema.invitation", "ht-invite-v1",
                                          "com.tessen.coffersharingmessagingd", "1",
                                          "stride-sharing-invite"};
  const std::size_t which = choices.below(std::size(names));
  Tree data =
      alternativeFor<VespKeelgateService::VespDictionaryContextClientSchema>(choices, which, depth);
  return ::PropertyList::Dictionary{
      {"cS", names[choices.rarely(16) ? choices.below(std::size(names)) : which]},
      {"cT", choices.rarely(16) ? valueFor<Int>(choices, depth) : Tree(1)},
      {"cD", std::move(data)}};
}

template <class T>
Tree valueFor(Choices& choices, int depth) {
  if (choices.rarely(128)) return anything(choices, depth);
  if constexpr (isOptional<T>) {
    return valueFor<typename T::value_type>(choices, depth);
  } else if constexpr (std::same_as<T, VespKeelgateService::VespInvitationContextSchema>) {
    return invitationContext(choices, depth + 1);
  } else if constexpr (Schema<T>) {
    return dictionaryFor<T>(choices, depth + 1);
  } else if constexpr (isArray<T>) {
    ::PropertyList::Array elements;
    // A schema may hold a list of its own kind: the deeper, the shorter.
    for (std::size_t n = depth < 8 ? choices.below(depth < 2 ? 6 : 2) : 0; n > 0; --n) {
      elements.push_back(valueFor<typename T::value_type>(choices, depth + 1));
    }
    return elements;
  } else if constexpr (Enumeration<T>) {
    if (choices.rarely(8)) return choices.number();
    const auto& cases = casesOf<T>;
    return static_cast<std::int64_t>(cases[choices.below(cases.size())].rawValue);
  } else if constexpr (std::same_as<T, Bool>) {
    return choices.below(2) == 0;
  } else if constexpr (std::integral<T>) {
    return static_cast<T>(choices.number());
  } else if constexpr (std::same_as<T, Double>) {
    const double number = static_cast<double>(static_cast<std::int64_t>(choices.number())) / 8;
    return choices.rarely(8) ? Tree(choices.number()) : Tree(number);
  } else if constexpr (std::same_as<T, Date>) {
    return ::PropertyList::Date{static_cast<double>(choices.number() >> 30)};
  } else if constexpr (std::same_as<T, UUID>) {
    UUID uuid{};
    for (std::uint8_t& octet : uuid.octets) octet = choices.byte();
    return Text::uuidText(uuid.octets);
  } else if constexpr (std::same_as<T, Data>) {
    return ::PropertyList::Data(choices.below(70), std::byte{choices.byte()});
  } else {
    return choices.text();
  }
}

template <class S>
Tree messageFor(Choices& choices) {
  if constexpr (std::same_as<S, VespKeelgateService::NoSchema>) {
    return anything(choices, 0);
  } else {
    return valueFor<S>(choices, 0);
  }
}

/// Every place that the program's tables name, and places that nobody answers at.
inline const std::vector<Target>& targets() {
  using namespace VespKeelgateService;
  static const std::vector<Target> all = [] {
    std::vector<Target> found;
    MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
      found.push_back(
          {recordNumber<typename U::SchemaType>, "", 0, messageFor<typename U::Schema>});
    });
    constexpr std::size_t result = recordNumber<Keelgate::VespClientMessageResult>;
    Services::each([&]<class S>(std::type_identity<S>) {
      S::Unpacker::Commands::each([&]<class Row>(std::type_identity<Row>) {
        found.push_back({result, std::string(S::identifier), Row::command.value_or(3),
                         messageFor<typename Row::Schema>});
      });
      found.push_back({result, std::string(S::identifier), 9999, messageFor<NoSchema>});
    });
    found.push_back({result, "nobody", 1, messageFor<NoSchema>});
    return found;
  }();
  return all;
}

}  // namespace Keelgate::Fuzz
