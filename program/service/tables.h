// SPDX-License-Identifier: Apache-2.0
/// What the service answers: the registration of a new kind of message is a row here. The entry
/// registers these tables, and `keelgate describe` prints them.
///
/// Types alone: nothing here exists at run time.
#pragma once

#include "program/invitation/vesp_invitation_unpacker.h"
#include "program/payload/vesp_command_response_unpacker.h"
#include "program/payload/vesp_command_web_tunnel_response_unpacker.h"
#include "program/payload/vesp_ostrel_payload_unpacker.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/service/vesp_sample_message_unpacker.h"
#include "program/service_unpacker/vesp_service_unpacker.h"
#include "program/session/viso_audio_video_message_unpacker.h"
#include "program/session/viso_live_photo_message_unpacker.h"
#include "program/waymark/waymark_message_unpacker.h"

namespace VespKeelgateService {

/// By the record that is asked for, in the order of registration.
using MessageUnpackers = Keelgate::TypeList<VespOstrelPayloadUnpacker, VespCommandResponseUnpacker,
                                            VespCommandWebTunnelResponseUnpacker,
                                            VespInvitationUnpacker, PropertyListUnpacker>;

/// By the service that a client message arrived under. Identifiers are compared exactly, with
/// regard to case.
using Services = Keelgate::TypeList<
    Service<"com.tessen.private.braid.rtcengine.rtctester", VespSampleMessageUnpacker>,
    Service<"com.tessen.private.braid.viso.video", VisoAudioVideoMessageUnpacker>,
    Service<"com.tessen.private.braid.viso.audio", VisoAudioVideoMessageUnpacker>,
    Service<"com.tessen.private.braid.viso.lp", VisoLivePhotoMessageUnpacker>,
    Service<"com.tessen.private.braid.waymark", WaymarkMessageUnpacker>>;

}  // namespace VespKeelgateService
