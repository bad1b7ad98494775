// SPDX-License-Identifier: Apache-2.0
/// Invitations: the envelope's schema string chooses one of five kinds.
#pragma once

#include "program/invitation/vesp_invitation_schemas.h"

#include <keelgate/records/vesp_invitation.h>

namespace VespKeelgateService {

struct VespInvitationUnpacker {
  using SchemaType = Keelgate::VespInvitation;
  using Schema = VespInvitationSchema;

  /// Throws DecodingError, or Breach for a kind that nobody knows.
  SchemaType unpack(Bytes from) const;
};

}  // namespace VespKeelgateService
