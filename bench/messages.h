// SPDX-License-Identifier: Apache-2.0
/// The messages that are measured: the same contents as a schema, in both encodings, and as
/// protobuf's generated classes write them. Made from the schemas' own lists with fixed seeds, many
/// of a kind: one message over and over is learnt by the machine, and flatters by two.
#pragma once

#include "plist/writer.h"
#include "program/payload/vesp_ostrel_protocol_payload.h"
#include "program/schema/mirror_encoding.h"
#include "program/service/vesp_sample_message_schema.h"
#include "program/waymark/waymark_schema.h"

#include <google/protobuf/message.h>

#include <random>
#include <string>
#include <vector>

namespace VespKeelgateService::Bench {

template <class S>
class Filler {
 public:
  /// `share` of the optional fields are there, in percent; lists of payloads stay away.
  Filler(unsigned seed, unsigned share) : random_(seed), share_(share) {}

  template <class T>
  void fill(T& value) {
    if constexpr (Keelgate::isOptional<T>) {
      if (random_() % 100 < share_) fill(value.emplace());
    } else if constexpr (Keelgate::isArray<T>) {
      if constexpr (std::same_as<T, Array<S>>) return;
      value.resize(1 + random_() % 2);
      for (auto& element : value) fill(element);
    } else if constexpr (Keelgate::Schema<T>) {
      T::CodingKeys::each([&](auto field) { fill(value.*field.member); });
    } else if constexpr (std::same_as<T, String>) {
      value.resize(4 + random_() % 36);
      for (char& c : value) c = static_cast<char>('a' + random_() % 26);
    } else if constexpr (std::same_as<T, Data>) {
      value.resize(4 + random_() % 28);
      for (std::byte& octet : value) octet = static_cast<std::byte>(random_());
    } else if constexpr (std::same_as<T, Bool>) {
      value = random_() % 2 == 0;
    } else if constexpr (std::same_as<T, Date>) {
      value.secondsSinceReferenceDate = static_cast<double>(random_());
    } else if constexpr (std::same_as<T, Double>) {
      value = static_cast<double>(random_()) / 65536;
    } else {
      // Small and large numbers, as counts, codes and times are.
      value = static_cast<T>(random_() >> random_() % 32);
    }
  }

 private:
  std::mt19937 random_;
  unsigned share_;
};

/// The same values in protobuf's message, by position.
template <class S>
void copyTo(google::protobuf::Message& message, const S& schema);

template <class T>
void setField(google::protobuf::Message& message, const google::protobuf::FieldDescriptor* field,
              const T& value) {
  const auto* set = message.GetReflection();
  if constexpr (Keelgate::isOptional<T>) {
    if (value) setField(message, field, *value);
  } else if constexpr (Keelgate::isArray<T>) {
    for (const auto& element : value) {
      if constexpr (Keelgate::Schema<typename T::value_type>) {
        copyTo(*set->AddMessage(&message, field), element);
      } else {
        set->AddString(&message, field, element);
      }
    }
  } else if constexpr (Keelgate::Schema<T>) {
    copyTo(*set->MutableMessage(&message, field), value);
  } else if constexpr (std::same_as<T, String>) {
    set->SetString(&message, field, value);
  } else if constexpr (std::same_as<T, Data>) {
    const auto* octets = reinterpret_cast<const char*>(value.data());
    set->SetString(&message, field, std::string(octets, value.size()));
  } else if constexpr (std::same_as<T, Bool>) {
    set->SetBool(&message, field, value);
  } else if constexpr (std::same_as<T, Date>) {
    set->SetDouble(&message, field, value.secondsSinceReferenceDate);
  } else if constexpr (std::same_as<T, Double>) {
    set->SetDouble(&message, field, value);
  } else if constexpr (std::signed_integral<T>) {
    set->SetInt64(&message, field, value);
  } else {
    set->SetUInt64(&message, field, value);
  }
}

template <class S>
void copyTo(google::protobuf::Message& message, const S& schema) {
  int number = 0;
  S::CodingKeys::each([&](auto field) {
    setField(message, message.GetDescriptor()->FindFieldByNumber(++number), schema.*field.member);
  });
}

/// Calls `visitor(bytes)` for the contents of every text and octet string.
template <class T, class Visitor>
void eachText(const T& value, Visitor&& visitor) {
  if constexpr (Keelgate::isOptional<T>) {
    if (value) eachText(*value, visitor);
  } else if constexpr (std::same_as<T, String> || std::same_as<T, Data>) {
    visitor(std::as_bytes(std::span(value)));
  } else if constexpr (Keelgate::isArray<T>) {
    for (const auto& element : value) eachText(element, visitor);
  } else if constexpr (Keelgate::Schema<T>) {
    T::CodingKeys::each([&](auto field) { eachText(value.*field.member, visitor); });
  }
}

struct Message {
  std::vector<std::byte> binary;
  std::string xml;
  std::string protobuf;
  /// All texts and octet strings: what has to be copied at least.
  std::vector<std::vector<std::byte>> texts;
};

template <class S, class Protobuf>
Message messageOf(const S& schema) {
  const PropertyList::Tree tree = mirror(schema);
  Protobuf protobuf;
  copyTo(protobuf, schema);
  Message made{PropertyList::writeBinary(tree),
               PropertyList::writeXml(tree),
               protobuf.SerializeAsString(),
               {}};
  eachText(schema, [&](auto bytes) { made.texts.emplace_back(bytes.begin(), bytes.end()); });
  return made;
}

/// Makes so many messages, each of other fields and values, after `change(schema, seed)`.
template <class S, class Protobuf, class Change>
auto manyOf(unsigned count, unsigned share, Change change) {
  return [=] {
    std::vector<Message> all;
    for (unsigned seed = 0; seed < count; ++seed) {
      S schema{};
      Filler<S>(seed, share).fill(schema);
      change(schema, seed);
      all.push_back(messageOf<S, Protobuf>(schema));
    }
    return all;
  };
}

}  // namespace VespKeelgateService::Bench
