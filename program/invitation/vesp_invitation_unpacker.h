// SPDX-License-Identifier: Apache-2.0
/// Invitations: the envelope's schema string chooses one of five kinds.
#pragma once

#include "framework/contracts/unpacker.h"
#include "program/invitation/vesp_invitation_schemas.h"

#include <keelgate/records/vesp_invitation.h>

namespace VespKeelgateService {

struct VespInvitationUnpacker {
  using SchemaType = Keelgate::VespInvitation;
  using Schema = VespInvitationSchema;

  /// Throws DecodingError, or Breach for a kind that nobody knows.
  SchemaType unpack(Bytes from) const;

  /// Throws what the records' constructors and token decoders throw.
  static Keelgate::VespDictionaryContext convertContext(VespDictionaryContextClientSchema&& kind);
};

// Here, where the framework's contract is known; the schemas themselves know nothing of it.
static_assert(Keelgate::VespInvitationClientPayload<VespSampleInvitationSchema>);
static_assert(Keelgate::VespInvitationClientPayload<VespHearthInvitationSchema>);
static_assert(Keelgate::VespInvitationClientPayload<VespCofferSharingInvitationSchema>);
static_assert(Keelgate::VespInvitationClientPayload<VespVitalsInvitationSchema>);
static_assert(Keelgate::VespInvitationClientPayload<VespStrideSharingInvitationSchema>);

}  // namespace VespKeelgateService
