// SPDX-License-Identifier: Apache-2.0
/// The document is checked before it is copied: nesting is bounded, keys are distinct, texts are
/// UTF-8 and dates finite. What is left to watch is how much is made of objects that the message
/// names many times.
#include "program/property_list/property_list_unpacker.h"

#include "framework/contracts/construct.h"
#include "plist/document.h"
#include "plist/expansion_budget.h"
#include "program/schema/property_list_decoder.h"

#include <utility>

namespace VespKeelgateService {

using Keelgate::PropertyListEntry;
using Keelgate::PropertyListSet;
using Keelgate::PropertyListUID;
using Keelgate::PropertyListValue;

namespace {

using ::PropertyList::Type;
using ::PropertyList::Value;

/// Most significant octet first, at most 16 of them.
PropertyListUID uidOf(Keelgate::Bytes octets) {
  PropertyListUID uid{};
  for (const std::byte octet : octets) {
    uid.high = uid.high << 8 | uid.low >> 56;
    uid.low = uid.low << 8 | std::to_integer<Keelgate::UInt64>(octet);
  }
  return uid;
}

class TreeBuilder {
 public:
  explicit TreeBuilder(::PropertyList::ExpansionBudget& budget) : budget_(budget) {}

  // Made in place: nothing is moved from level to level.
  void build(const Value& from, PropertyListValue& into) {
    switch (from.type()) {
      case Type::null:
        into.emplace<std::nullptr_t>();
        return;
      case Type::boolean:
        into.emplace<Keelgate::Bool>(from.boolean());
        return;
      case Type::integer:
        return buildInteger(from.integer(), into);
      case Type::real:
        into.emplace<Keelgate::Double>(from.real());
        return;
      case Type::date:
        into.emplace<Keelgate::Date>(Keelgate::Date{from.date()});
        return;
      case Type::string:
        spend(from, from.string().size());
        into.emplace<Keelgate::String>(from.string());
        return;
      case Type::data:
        spend(from, from.data().size());
        into.emplace<Keelgate::Data>(from.data().begin(), from.data().end());
        return;
      case Type::uid:
        into.emplace<PropertyListUID>(uidOf(from.uid()));
        return;
      case Type::array:
        return buildElements(from, into.emplace<Keelgate::Array<PropertyListValue>>());
      case Type::set:
        return buildElements(from, into.emplace<PropertyListSet>().elements);
      case Type::dictionary:
        return buildEntries(from, into.emplace<Keelgate::Array<PropertyListEntry>>());
    }
  }

 private:
  // Twice: what is made is written into the reply too.
  void spend(const Value& from, std::size_t bytes) { budget_.spend(from, 2 * bytes); }

  static void buildInteger(::PropertyList::Integer integer, PropertyListValue& into) {
    const auto number = static_cast<Keelgate::Int64>(integer.bits);
    if (!integer.negative && number < 0) {
      into.emplace<Keelgate::UInt64>(integer.bits);
    } else {
      into.emplace<Keelgate::Int64>(number);
    }
  }

  void buildElements(const Value& from, Keelgate::Array<PropertyListValue>& into) {
    spend(from, from.count() * sizeof(PropertyListValue));
    into.reserve(from.count());
    for (const Value element : from.elements()) build(element, into.emplace_back());
  }

  void buildEntries(const Value& from, Keelgate::Array<PropertyListEntry>& into) {
    spend(from, from.count() * sizeof(PropertyListEntry));
    into.reserve(from.count());
    for (const ::PropertyList::Entry entry : from.entries()) {
      // The attack: one long key in a thousand dictionaries. Whether a key is shared is not told,
      // so all of them cost; honest ones cost no more than the message's length.
      budget_.take(from, 2 * entry.key.size());
      PropertyListEntry& made = into.emplace_back();
      made.key = entry.key;
      build(entry.value, made.value);
    }
  }

  ::PropertyList::ExpansionBudget& budget_;
};

}  // namespace

Keelgate::PropertyList PropertyListUnpacker::unpack(Bytes from) const {
  Keelgate::PropertyList record{};
  PropertyListDecoder().read(from, ::PropertyList::noKnownKeys,
                             [&](Decoding& decoding, const Value& top) {
                               TreeBuilder(decoding.budget).build(top, record.value);
                             });
  return Keelgate::construct(std::move(record));
}

}  // namespace VespKeelgateService
