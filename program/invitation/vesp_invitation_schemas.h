// SPDX-License-Identifier: Apache-2.0
/// The envelope of an invitation, and the five kinds that its context can hold. Data alone: how the
/// context is decoded is in the unpacker, and everything else follows from the lists.
#pragma once

#include "program/invitation/vesp_hearth_invitation_schema.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// All of it is optional: an empty dictionary is such an invitation.
struct VespSampleInvitationSchema {
  KEELGATE_SCHEMA(VespSampleInvitationSchema,
      (Optional<String>, title),
      (Optional<Date>, date),
      (Optional<String>, reason));
};

/// A group of stored credentials is shared.
struct VespCofferSharingInvitationSchema {
  KEELGATE_SCHEMA(VespCofferSharingInvitationSchema,
      (String, groupID),
      (String, shareURL),
      (Data, invitationToken),
      (String, inviteeHandle),
      (Optional<Date>, sentTime),
      // Deliberate: the display name travels as the group's name.
      (Optional<String>, displayName, "groupName"));
};

/// An opaque serialised message. It is not looked into here.
struct VespVitalsInvitationSchema {
  KEELGATE_SCHEMA(VespVitalsInvitationSchema,
      (Data, protobufData, "ObjectDataKey"));
};

/// An item number and an opaque serialised message. It is not looked into here.
struct VespStrideSharingInvitationSchema {
  KEELGATE_SCHEMA(VespStrideSharingInvitationSchema,
      (Int64, protobufItem, "item"),
      (Data, protobufPayload, "payload"));
};

/// Not the framework's type of the same name: this one is the number on the wire. One way so far;
/// another number is refused before the schema string is looked at.
KEELGATE_ENUMERATION(VespInvitationContextType, Int,
    (dictionary, 1));

/// In the order of the framework's cases.
KEELGATE_CASES(VespDictionaryContextClientSchema,
    (VespSampleInvitationSchema, vespSampleInvitation),
    (VespHearthInvitationSchema, vespHearthInvitation),
    (VespCofferSharingInvitationSchema, vespCofferSharingInvitation),
    (VespVitalsInvitationSchema, vespVitalsInvitation),
    (VespStrideSharingInvitationSchema, vespStrideSharingInvitation));

/// A level of naming: the framework's record has one too.
KEELGATE_CASES(VespDictionaryContextData,
    (VespDictionaryContextClientSchema, dictionaryContext));

/// The context names its kind by a schema string, which says how the data are decoded.
struct VespInvitationContextSchema {
  KEELGATE_SCHEMA(VespInvitationContextSchema,
      (String, schema, "cS"),
      (VespInvitationContextType, contextType, "cT"),
      (VespDictionaryContextData, contextData, "cD"));

  /// Deliberate: reads the data as the dictionary of the kind itself, while the mirror encoding
  /// writes the case-keyed form. The two are not inverse.
  static VespInvitationContextSchema decode(const KeyedContainer& container);
};

/// `state` and `expiration` travel as they are: neither a range nor a clock is asked.
struct VespInvitationSchema {
  KEELGATE_SCHEMA(VespInvitationSchema,
      (VespInvitationContextSchema, context, "c"),
      (Int64, state, "s"),
      (Optional<Double>, expiration, "e"),
      (String, identifier, "uID"));
};

}  // namespace VespKeelgateService
