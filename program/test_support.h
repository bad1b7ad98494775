// SPDX-License-Identifier: Apache-2.0
/// Messages in, one line of text out: what the tables of the program's tests are made of.
#pragma once

#include "plist/tree.h"
#include "plist/writer.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>
#include <keelgate/records.h>

#include <functional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace VespKeelgateService::Testing {

/// The present fields of a schema or record, one "path=value" each, in order. Empty lists are left
/// out: a record cannot tell them from absent ones.
using Fields = std::vector<std::string>;

template <class T>
void flatten(const std::string& path, const T& value, Fields& into) {
  using namespace Keelgate;
  if constexpr (isOptional<T>) {
    if (value) flatten(path, *value, into);
  } else if constexpr (isArray<T>) {
    for (std::size_t i = 0; i < value.size(); ++i) {
      flatten(path + "[" + std::to_string(i) + "]", value[i], into);
    }
  } else if constexpr (CaseKeyed<T>) {
    std::visit(
        [&](const auto& payload) {
          flatten(path + "." + std::string(T::caseNames[value.index()]), payload, into);
        },
        value);
  } else if constexpr (Described<T>) {
    const std::size_t before = into.size();
    FieldsOf<T>::each([&](auto field) {
      flatten(path + "." + std::string(field.name), value.*field.member, into);
    });
    if (into.size() == before) into.push_back(path + "={}");
  } else if constexpr (std::same_as<T, std::nullptr_t>) {
    into.push_back(path + "=null");
  } else if constexpr (std::same_as<T, String>) {
    into.push_back(path + "=" + value);
  } else if constexpr (std::same_as<T, Data>) {
    into.push_back(path + "=" +
                   std::string(reinterpret_cast<const char*>(value.data()), value.size()));
  } else if constexpr (std::same_as<T, Date>) {
    into.push_back(path + "=" + std::to_string(value.secondsSinceReferenceDate));
  } else if constexpr (std::same_as<T, UUID>) {
    std::string text = path + "=";
    for (std::uint8_t octet : value.octets) text += std::to_string(octet) + ":";
    into.push_back(text);
  } else if constexpr (Enumeration<T>) {
    into.push_back(path + "=" + std::to_string(rawValueOf(value)));
  } else {
    into.push_back(path + "=" + std::to_string(value));
  }
}

template <class T>
Fields flatten(const T& value) {
  Fields fields;
  flatten("", value, fields);
  return fields;
}

std::string joined(const Fields& fields);

/// Where a message goes: to a record, or to a service with a command.
struct Target {
  std::string recordOrService;
  std::uint64_t command = 0;
};

/// The fields of the record that the message gives, or its error in one line.
std::string outcome(const Target& target, Keelgate::Bytes message);

/// The same for a tree in both encodings, which must agree.
std::string outcome(const Target& target, const PropertyList::Tree& tree);

/// What the body throws, in one line; "" when it returns.
std::string errorOf(const std::function<void()>& body);

inline const Target sample{"com.tessen.private.braid.rtcengine.rtctester", 1};
inline const Target payload{"PulseUserPayload"};
inline const Target response{"VespCommandResponse"};
inline const Target tunnel{"VespCommandWebTunnelResponse"};
inline const Target invitation{"VespInvitation"};
inline const Target checkIn{"com.tessen.private.braid.waymark", 3};
inline constexpr const char* video = "com.tessen.private.braid.viso.video";
inline constexpr const char* audio = "com.tessen.private.braid.viso.audio";
inline constexpr const char* livePhoto = "com.tessen.private.braid.viso.lp";

PropertyList::Tree data(std::string_view text);

/// Entries of the first over those of the second.
PropertyList::Dictionary with(PropertyList::Dictionary changes, PropertyList::Dictionary base);

/// `name` as the only record whose constructor refuses, for as long as this lives.
class Refusing {
 public:
  explicit Refusing(std::string_view name);
  ~Refusing();
  Refusing(const Refusing&) = delete;
  Refusing& operator=(const Refusing&) = delete;
};

}  // namespace VespKeelgateService::Testing
