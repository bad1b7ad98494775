// SPDX-License-Identifier: Apache-2.0
// Every field of every schema arrives under its own label and nowhere else: with all fields set to
// distinct values, and with each one set alone. The messages are made by walking the schemas, so a
// new kind of message is one more line in the list at the end.
#include "program/schema/mirror_encoding.h"
#include "program/service/tables.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

#include <map>

namespace VespKeelgateService::Testing {

namespace {

using Keelgate::isArray;
using Keelgate::isOptional;
using Keelgate::Schema;

/// Gives every value a different one, as far as its type has so many.
class Filler {
 public:
  template <class T>
  void fill(T& value, int depth = 0) {
    const int n = ++last_;
    if constexpr (isOptional<T>) {
      fill(value.emplace(), depth);
    } else if constexpr (isArray<T>) {
      if (depth < 2) value.resize(2);
      for (auto& element : value) fill(element, depth + 1);
    } else if constexpr (Schema<T>) {
      T::CodingKeys::each([&](auto field) { fill(value.*field.member, depth); });
    } else if constexpr (std::same_as<T, String>) {
      value = "text " + std::to_string(n);
    } else if constexpr (std::same_as<T, Data>) {
      const std::string text = "octets " + std::to_string(n);
      const auto bytes = std::as_bytes(std::span(text));
      value.assign(bytes.begin(), bytes.end());
    } else if constexpr (std::same_as<T, Date>) {
      value.secondsSinceReferenceDate = n;
    } else if constexpr (std::same_as<T, UUID>) {
      value.octets[3] = static_cast<std::uint8_t>(n >> 8);
      value.octets[15] = static_cast<std::uint8_t>(n);
    } else if constexpr (std::same_as<T, Bool>) {
      value = n % 2 == 0;
    } else if constexpr (Keelgate::Enumeration<T>) {
      value = static_cast<T>(Keelgate::casesOf<T>.back().rawValue);
    } else if constexpr (std::same_as<T, Double>) {
      value = n + 0.25;
    } else {
      value = static_cast<T>(n);
    }
  }

 private:
  int last_ = 100;
};

/// What a record is expected to hold of the schema's fields.
using Expect = Fields (*)(Fields schema);

Fields unchanged(Fields fields) {
  return fields;
}

std::string replaced(std::string text, std::string_view from, std::string_view to) {
  if (text.starts_with(from)) text.replace(0, from.size(), to);
  return text;
}

Fields homeInvitation(Fields fields) {
  Fields expected;
  for (const std::string& field : fields) {
    // The one field that goes nowhere.
    if (field.starts_with(".invitationShareURL=")) continue;
    std::string to = replaced(field, ".invitationExpiryDate=", ".inviteExpiryDate=");
    to = replaced(to, ".suppressInvite", ".homeSuppressInvite");
    to = replaced(to, ".invitationShareToken=", ".invitationShareToken.tokenData=");
    expected.push_back(std::move(to));
  }
  if (expected.empty()) return {"={}"};
  return expected;
}

Fields cofferInvitation(Fields fields) {
  Fields expected;
  for (const std::string& field : fields) {
    if (field.starts_with(".shareURL=")) continue;
    expected.push_back(replaced(field, ".invitationToken=", ".invitationToken.tokenData="));
  }
  return expected;
}

Fields vitalsInvitation(Fields fields) {
  return {replaced(fields.at(0), ".protobufData=", ".untrustedData=")};
}

Fields strideInvitation(Fields fields) {
  return {replaced(fields.at(0), ".protobufItem=", ".item="),
          replaced(fields.at(1), ".protobufPayload=", ".untrustedData=")};
}

/// Numbered fields move into their group; codes that no enumeration knows become its default.
Fields checkIn(Fields fields) {
  Fields expected;
  std::map<int, std::map<std::string, std::string>> groups;
  for (const std::string& field : fields) {
    const std::size_t equals = field.find('=');
    const std::string name = field.substr(1, equals - 1);
    const std::size_t digits = name.find_last_not_of("0123456789") + 1;
    const std::string code = replaced(field, "." + name + "=", "");
    if (digits < name.size()) {
      groups[std::stoi(name.substr(digits))][name.substr(0, digits)] = code;
      continue;
    }
    const bool isCode =
        name.ends_with("Type") || name == "lowPowerModeWarningState" || name == "referenceFrame";
    expected.push_back(isCode ? "." + name + "=0" : field);
  }
  for (int number = 2; number <= 32; ++number) {
    const std::string group = ".groupFields[" + std::to_string(number - 2) + "].";
    expected.push_back(group + "groupNumber=" + std::to_string(number));
    for (const char* name :
         {"receiverHandle", "sharingInvitationData", "shareURL", "participantID"}) {
      const auto value = groups[number].find(name);
      if (value != groups[number].end()) {
        expected.push_back(group + name + "=" + value->second);
      }
    }
  }
  return expected;
}

struct Kind {
  Target target;
  /// Where the schema's own fields begin in the record.
  std::string prefix;
  Expect expect;
  /// A schema inside the envelope of an invitation is chosen by this.
  std::string invitationSchema;
};

std::string outcomeInEnvelope(const Kind& kind, PropertyList::Tree message) {
  if (kind.invitationSchema.empty()) return outcome(kind.target, message);
  using PropertyList::Dictionary;
  return outcome(
      kind.target,
      Dictionary{
          {"c", Dictionary{{"cS", kind.invitationSchema}, {"cT", 1}, {"cD", std::move(message)}}},
          {"s", 1},
          {"uID", "identifier"}});
}

template <class S>
void expectToArrive(const Kind& kind, const S& schema, std::string_view what) {
  std::string got = outcomeInEnvelope(kind, mirror(schema));
  if (!kind.invitationSchema.empty()) {
    // What surrounds the kind in the envelope.
    got =
        replaced(got, ".context.schema=" + kind.invitationSchema + " .context.contextType=1 ", "");
    got = got.substr(0, got.rfind(" .state=1 .identifier=identifier"));
  }
  std::string expected;
  for (const std::string& field : kind.expect(flatten(schema))) {
    expected += (expected.empty() ? "" : " ") + kind.prefix + field;
  }
  EXPECT_EQ(got, expected) << Keelgate::typeName<S>() << ": " << what;
}

template <class S>
void expectEveryFieldToArrive(const Kind& kind) {
  S full{};
  Filler().fill(full);
  expectToArrive(kind, full, "all fields");

  S::CodingKeys::each([&](auto field) {
    S alone{};
    // The required fields, and of the optional ones this one alone.
    S::CodingKeys::each([&](auto other) {
      if constexpr (!isOptional<typename decltype(other)::Value>) {
        alone.*other.member = full.*other.member;
      }
    });
    if constexpr (isOptional<typename decltype(field)::Value>) {
      alone.*field.member = full.*field.member;
    }
    expectToArrive(kind, alone, field.name);
  });
}

const std::string context = ".context.context.dictionary.";

TEST(FullMessage, EveryFieldArrivesUnderItsOwnLabel) {
  expectEveryFieldToArrive<VespSampleMessageSchema>(
      {{"com.tessen.private.braid.rtcengine.rtctester", 1},
       ".result.vespSampleMessage",
       unchanged,
       ""});
  expectEveryFieldToArrive<VespSessionInvitationSchema>(
      {{video, 232}, ".result.sessionInvitation", unchanged, ""});
  expectEveryFieldToArrive<VespSessionAcceptSchema>(
      {{video, 233}, ".result.sessionAccept", unchanged, ""});
  expectEveryFieldToArrive<VespSessionDeclineSchema>(
      {{video, 234}, ".result.sessionDecline", unchanged, ""});
  expectEveryFieldToArrive<VespSessionDeclineSchema>(
      {{video, 237}, ".result.sessionDecline", unchanged, ""});
  expectEveryFieldToArrive<VespSessionCancelSchema>(
      {{video, 235}, ".result.sessionCancel", unchanged, ""});
  expectEveryFieldToArrive<VespSessionReinitiateSchema>(
      {{video, 238}, ".result.sessionReinitiate", unchanged, ""});
  expectEveryFieldToArrive<VespOstrelProtocolPayload>({{"PulseUserPayload"}, "", unchanged, ""});
  expectEveryFieldToArrive<VespCommandResponseSchema>({{"VespCommandResponse"}, "", unchanged, ""});
  expectEveryFieldToArrive<VespCommandWebTunnelResponseSchema>(
      {{"VespCommandWebTunnelResponse"}, "", unchanged, ""});
  expectEveryFieldToArrive<WaymarkSchema>(
      {{"com.tessen.private.braid.waymark", 3}, ".result.waymarkMessage", checkIn, ""});

  const Target invitation{"VespInvitation"};
  expectEveryFieldToArrive<VespSampleInvitationSchema>({invitation,
                                                        context + "vespSampleInvitation", unchanged,
                                                        "com.tessen.Vesp.schema.invitation"});
  expectEveryFieldToArrive<VespHearthInvitationSchema>(
      {invitation, context + "vespHearthInvitation", homeInvitation, "ht-invite-v1"});
  expectEveryFieldToArrive<VespCofferSharingInvitationSchema>(
      {invitation, context + "vespCofferSharingInvitation", cofferInvitation,
       "com.tessen.coffersharingmessagingd"});
  expectEveryFieldToArrive<VespVitalsInvitationSchema>(
      {invitation, context + "vespVitalsInvitation", vitalsInvitation, "1"});
  expectEveryFieldToArrive<VespStrideSharingInvitationSchema>(
      {invitation, context + "vespStrideSharingInvitation", strideInvitation,
       "stride-sharing-invite"});
}

}  // namespace

}  // namespace VespKeelgateService::Testing
