// SPDX-License-Identifier: Apache-2.0
// Every field of every schema arrives under its own label and nowhere else: with all fields set to
// distinct values, and with each one set alone. The messages are made by walking the schemas, so a
// new kind of message is one more line in the list at the end.
#include "program/schema/mirror_encoding.h"
#include "program/service/tables.h"
#include "program/test_support.h"
#include "tests/filler.h"

#include <gtest/gtest.h>

#include <map>

namespace VespKeelgateService::Testing {

namespace {

using Keelgate::isOptional;

/// What a record is expected to hold of the schema's fields.
using Expect = std::function<Fields(const Fields& schema)>;

/// Fields that begin with the first of a pair begin with the second instead, and go nowhere when
/// that is empty.
Expect moved(std::vector<std::pair<std::string, std::string>> moves) {
  return [moves = std::move(moves)](const Fields& fields) {
    Fields expected;
    for (std::string field : fields) {
      for (const auto& [from, to] : moves) {
        if (field.starts_with(from)) field.replace(0, to.empty() ? field.size() : from.size(), to);
      }
      if (!field.empty()) expected.push_back(field);
    }
    return expected.empty() ? Fields{"={}"} : expected;
  };
}

/// Numbered fields move into their group; codes that no enumeration knows become its default.
Fields groupsFolded(const Fields& fields) {
  Fields expected;
  std::map<std::string, std::string> values;
  for (const std::string& field : fields) {
    const std::string name = field.substr(1, field.find('=') - 1);
    values[name] = field.substr(name.size() + 2);
    const bool isCode =
        name.ends_with("Type") || name == "lowPowerModeWarningState" || name == "referenceFrame";
    if (std::isdigit(name.back()) == 0) expected.push_back(isCode ? "." + name + "=0" : field);
  }
  for (int number = 2; number <= 32; ++number) {
    const std::string group = ".groupFields[" + std::to_string(number - 2) + "].";
    expected.push_back(group + "groupNumber=" + std::to_string(number));
    for (const char* name :
         {"receiverHandle", "sharingInvitationData", "shareURL", "participantID"}) {
      const auto value = values.find(name + std::to_string(number));
      if (value != values.end()) expected.push_back(group + name + "=" + value->second);
    }
  }
  return expected;
}

struct Kind {
  Target target;
  /// Where the schema's own fields begin in the record.
  std::string prefix;
  Expect expect = moved({});
  /// A schema inside the envelope of an invitation is chosen by this.
  std::string invitationSchema = "";
};

template <class S>
void expectToArrive(const Kind& kind, const S& schema, std::string_view what) {
  using PropertyList::Dictionary;
  Fields expected = kind.expect(flatten(schema));
  for (std::string& field : expected) field.insert(0, kind.prefix);
  PropertyList::Tree message = mirror(schema);
  const std::string& chosenBy = kind.invitationSchema;
  if (!chosenBy.empty()) {
    message = Dictionary{{"c", Dictionary{{"cS", chosenBy}, {"cT", 1}, {"cD", std::move(message)}}},
                         {"s", 1},
                         {"uID", "u"}};
    expected.insert(expected.begin(), {".context.schema=" + chosenBy, ".context.contextType=1"});
    expected.insert(expected.end(), {".state=1", ".identifier=u"});
  }
  EXPECT_EQ(outcome(kind.target, message), joined(expected))
      << Keelgate::typeName<S>() << ": " << what;
}

template <class S>
void expectEveryField(const Kind& kind) {
  S full{};
  Keelgate::Testing::Filler().fill(full);
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

TEST(FullMessage, EveryFieldArrivesUnderItsOwnLabel) {
  expectEveryField<VespSampleMessageSchema>({sample, ".result.vespSampleMessage"});
  expectEveryField<VespSessionInvitationSchema>({{video, 232}, ".result.sessionInvitation"});
  expectEveryField<VespSessionAcceptSchema>({{video, 233}, ".result.sessionAccept"});
  expectEveryField<VespSessionDeclineSchema>({{video, 234}, ".result.sessionDecline"});
  expectEveryField<VespSessionDeclineSchema>({{video, 237}, ".result.sessionDecline"});
  expectEveryField<VespSessionCancelSchema>({{video, 235}, ".result.sessionCancel"});
  expectEveryField<VespSessionReinitiateSchema>({{video, 238}, ".result.sessionReinitiate"});
  expectEveryField<VespOstrelProtocolPayload>({payload, ""});
  expectEveryField<VespCommandResponseSchema>({response, ""});
  expectEveryField<VespCommandWebTunnelResponseSchema>({tunnel, ""});
  expectEveryField<WaymarkSchema>({checkIn, ".result.waymarkMessage", groupsFolded});

  const std::string context = ".context.context.dictionary.";
  expectEveryField<VespSampleInvitationSchema>({invitation, context + "vespSampleInvitation",
                                                moved({}), "com.tessen.Vesp.schema.invitation"});
  expectEveryField<VespHearthInvitationSchema>(
      {invitation, context + "vespHearthInvitation",
       moved({{".invitationShareURL=", ""},
              {".invitationExpiryDate=", ".inviteExpiryDate="},
              {".suppressInvite", ".homeSuppressInvite"},
              {".invitationShareToken=", ".invitationShareToken.tokenData="}}),
       "ht-invite-v1"});
  expectEveryField<VespCofferSharingInvitationSchema>(
      {invitation, context + "vespCofferSharingInvitation",
       moved({{".shareURL=", ""}, {".invitationToken=", ".invitationToken.tokenData="}}),
       "com.tessen.coffersharingmessagingd"});
  expectEveryField<VespVitalsInvitationSchema>({invitation, context + "vespVitalsInvitation",
                                                moved({{".protobufData=", ".untrustedData="}}),
                                                "1"});
  expectEveryField<VespStrideSharingInvitationSchema>(
      {invitation, context + "vespStrideSharingInvitation",
       moved({{".protobufItem=", ".item="}, {".protobufPayload=", ".untrustedData="}}),
       "stride-sharing-invite"});
}

}  // namespace

}  // namespace VespKeelgateService::Testing
