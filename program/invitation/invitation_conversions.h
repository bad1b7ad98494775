// SPDX-License-Identifier: Apache-2.0
/// From the schema of each kind of invitation to its record. Every one throws what the record's
/// constructor, or the decoder of its token, throws.
///
/// Pure functions; callable from any thread. The schemas are consumed.
#pragma once

#include "program/invitation/vesp_invitation_schemas.h"

#include <keelgate/records/vesp_invitation.h>

namespace VespKeelgateService {

Keelgate::VespSampleInvitation convertKind(VespSampleInvitationSchema&& schema);
/// Deliberate: its share URL goes nowhere, and that of the credentials' kind only to the decoder of
/// the token.
Keelgate::VespHearthInvitation convertKind(VespHearthInvitationSchema&& schema);
Keelgate::VespCofferSharingInvitation convertKind(VespCofferSharingInvitationSchema&& schema);
/// The octets of these two are handed on unread: what is in them is another program's format.
Keelgate::VespVitalsInvitation convertKind(VespVitalsInvitationSchema&& schema);
Keelgate::VespStrideSharingInvitation convertKind(VespStrideSharingInvitationSchema&& schema);

}  // namespace VespKeelgateService
