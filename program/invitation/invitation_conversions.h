// SPDX-License-Identifier: Apache-2.0
/// From the schema of each kind of invitation to its record. Every one throws what the record's
/// constructor, or the decoder of its token, throws.
#pragma once

#include "program/invitation/vesp_invitation_schemas.h"

#include <keelgate/records/vesp_invitation.h>

namespace VespKeelgateService {

Keelgate::VespSampleInvitation convertKind(VespSampleInvitationSchema&& schema);
Keelgate::VespHearthInvitation convertKind(VespHearthInvitationSchema&& schema);
Keelgate::VespCofferSharingInvitation convertKind(VespCofferSharingInvitationSchema&& schema);
Keelgate::VespVitalsInvitation convertKind(VespVitalsInvitationSchema&& schema);
Keelgate::VespStrideSharingInvitation convertKind(VespStrideSharingInvitationSchema&& schema);

}  // namespace VespKeelgateService
