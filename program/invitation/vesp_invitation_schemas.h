// SPDX-License-Identifier: Apache-2.0
/// The envelope of an invitation, and the five kinds that its context can hold. Data alone: how the
/// context is decoded is in the unpacker, and everything else follows from the lists.
#pragma once

#include "program/invitation/vesp_hearth_invitation_schema.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>
#include <variant>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// All of it is optional: an empty dictionary is such an invitation.
struct VespSampleInvitationSchema {
  FIELD(Optional<String>, title);
  FIELD(Optional<Date>, date);
  FIELD(Optional<String>, reason);

  CODING_KEYS(VespSampleInvitationSchema);
};

/// A group of stored credentials is shared.
struct VespCofferSharingInvitationSchema {
  FIELD(String, groupID);
  FIELD(String, shareURL);
  FIELD(Data, invitationToken);
  FIELD(String, inviteeHandle);
  FIELD(Optional<Date>, sentTime);
  // Deliberate: the display name travels as the group's name.
  FIELD(Optional<String>, displayName, "groupName");

  CODING_KEYS(VespCofferSharingInvitationSchema);
};

/// An opaque serialised message. It is not looked into here.
struct VespVitalsInvitationSchema {
  FIELD(Data, protobufData, "ObjectDataKey");

  CODING_KEYS(VespVitalsInvitationSchema);
};

/// An item number and an opaque serialised message. It is not looked into here.
struct VespStrideSharingInvitationSchema {
  FIELD(Int64, protobufItem, "item");
  FIELD(Data, protobufPayload, "payload");

  CODING_KEYS(VespStrideSharingInvitationSchema);
};

/// Not the framework's type of the same name: this one is the number on the wire. One way so far;
/// another number is refused before the schema string is looked at.
ENUMERATION(VespInvitationContextType, Int, dictionary = 1);

/// In the order of the framework's cases.
struct VespDictionaryContextClientSchema
    : std::variant<VespSampleInvitationSchema, VespHearthInvitationSchema,
                   VespCofferSharingInvitationSchema, VespVitalsInvitationSchema,
                   VespStrideSharingInvitationSchema> {
  CASES(VespDictionaryContextClientSchema, vespSampleInvitation, vespHearthInvitation,
        vespCofferSharingInvitation, vespVitalsInvitation, vespStrideSharingInvitation);
};

/// A level of naming: the framework's record has one too.
struct VespDictionaryContextData : std::variant<VespDictionaryContextClientSchema> {
  CASES(VespDictionaryContextData, dictionaryContext);
};

/// The context names its kind by a schema string, which says how the data are decoded.
struct VespInvitationContextSchema {
  FIELD(String, schema, "cS");
  FIELD(VespInvitationContextType, contextType, "cT");
  FIELD(VespDictionaryContextData, contextData, "cD");

  CODING_KEYS(VespInvitationContextSchema);

  /// Deliberate: reads the data as the dictionary of the kind itself, while the mirror encoding
  /// writes the case-keyed form. The two are not inverse.
  static VespInvitationContextSchema decode(const KeyedContainer& container);
};

/// `state` and `expiration` travel as they are: neither a range nor a clock is asked.
struct VespInvitationSchema {
  FIELD(VespInvitationContextSchema, context, "c");
  FIELD(Int64, state, "s");
  FIELD(Optional<Double>, expiration, "e");
  FIELD(String, identifier, "uID");

  CODING_KEYS(VespInvitationSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
