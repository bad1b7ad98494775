// SPDX-License-Identifier: Apache-2.0
#include "program/test_support.h"

#include "framework/contracts/construct.h"
#include "program/service/tables.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <gtest/gtest.h>

namespace VespKeelgateService::Testing {

namespace {

// Read on several threads by the tests that unpack on several, written by none of them.
std::string refused;

std::string pathText(const Array<Keelgate::CodingKey>& path) {
  std::string text;
  for (const auto& step : path) {
    if (!text.empty()) text += '.';
    if (const auto* index = std::get_if<std::size_t>(&step)) text += std::to_string(*index);
    if (const auto* key = std::get_if<String>(&step)) text += *key;
  }
  return text;
}

std::string text(const Keelgate::DecodingError& error) {
  using Kind = Keelgate::DecodingError::Kind;
  switch (error.kind) {
    case Kind::keyNotFound:
      return "keyNotFound " + error.key.value_or("?") + " @" + pathText(error.codingPath);
    case Kind::typeMismatch:
      return "typeMismatch @" + pathText(error.codingPath);
    case Kind::valueNotFound:
      return "valueNotFound @" + pathText(error.codingPath);
    case Kind::dataCorrupted:
      return "dataCorrupted @" + pathText(error.codingPath);
  }
  return "?";
}

std::string unpackedBy(const Target& target, Keelgate::Bytes message) {
  std::string found;
  MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
    if (Keelgate::typeName<typename U::SchemaType>() != target.recordOrService) return;
    found = joined(flatten(U().unpack(message)));
  });
  if (!found.empty()) return found;
  static const VespClientMessageUnpacker router{Services()};
  return joined(flatten(
      router.unpack(message, {.command = target.command, .service = target.recordOrService})));
}

}  // namespace

std::string joined(const Fields& fields) {
  std::string all;
  for (const std::string& field : fields) all += (all.empty() ? "" : " ") + field;
  return all;
}

std::string errorOf(const std::function<void()>& body) {
  try {
    body();
    return "";
  } catch (const Keelgate::DecodingError& error) {
    return text(error);
  } catch (const Keelgate::Breach& error) {
    return "breach " + error.domain + ": " + error.errorType + error.keyPath.value_or("");
  } catch (const VespClientMessageUnpackingError& error) {
    return "unpacking " + std::to_string(error.code()) + ": " +
           (error.command ? std::to_string(error.command->rawValue()) : "") +
           error.service.value_or("");
  }
}

std::string outcome(const Target& target, Keelgate::Bytes message) {
  std::string record;
  const std::string error = errorOf([&] { record = unpackedBy(target, message); });
  return error.empty() ? record : error;
}

std::string outcome(const Target& target, const PropertyList::Tree& tree) {
  const auto binary = PropertyList::writeBinary(tree);
  const std::string xml = PropertyList::writeXml(tree);
  std::string fromBinary = outcome(target, Keelgate::Bytes(binary));
  const std::string fromXml = outcome(target, std::as_bytes(std::span(xml)));
  EXPECT_EQ(fromBinary, fromXml) << "binary and XML disagree about\n" << xml;
  return fromBinary;
}

PropertyList::Tree data(std::string_view text) {
  const auto bytes = std::as_bytes(std::span(text));
  return PropertyList::Data(bytes.begin(), bytes.end());
}

PropertyList::Dictionary with(PropertyList::Dictionary changes, PropertyList::Dictionary base) {
  for (auto& entry : base) {
    const auto same = [&](const auto& change) {
      return change.first == entry.first;
    };
    if (std::none_of(changes.begin(), changes.end(), same)) changes.push_back(std::move(entry));
  }
  return changes;
}

Refusing::Refusing(std::string_view name) {
  refused = name;
}
Refusing::~Refusing() {
  refused.clear();
}

}  // namespace VespKeelgateService::Testing

// In place of the framework's own, which accepts everything.
void Keelgate::admit(std::string_view record) {
  using VespKeelgateService::Testing::refused;
  if (!refused.empty() && record == refused) throw Breach("test", "refused " + refused);
}
