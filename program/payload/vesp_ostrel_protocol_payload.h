// SPDX-License-Identifier: Apache-2.0
/// The push payload: message delivery, attachments, web-tunnel exchanges, receipts and media relays
/// in one flat dictionary. Only the command is required. Keys are case-sensitive: "h" and "H", "ri"
/// and "rI" are different fields. Payloads nest in payloads, as deep as property lists do.
#pragma once

#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Values are decoded and never combined: no field decides whether another counts, and no list has
/// a length that another must have.
struct VespOstrelProtocolPayload {
  KEELGATE_SCHEMA(VespOstrelProtocolPayload,
      // What the payload is: the one field that is always there.
      (Int, command, "c"),
      (Optional<Int>, commandContext, "cc"),
      (Optional<Int>, version, "v"),
      // The content, encrypted by its sender, in one of several wrappings.
      (Optional<Data>, payload, "P"),
      (Optional<Data>, bulkedPayload, "N"),
      (Optional<Data>, fanoutPayload, "fP"),
      (Optional<Data>, additionalPayload, "aP"),
      (Optional<Data>, payloadMetadata, "Pm"),
      // Deliberate: a string here, an integer in the answers to commands.
      (Optional<String>, messageId, "i"),
      (Optional<Data>, messageUUID, "U"),
      (Optional<String>, queueId, "qI"),
      // Receipts: what the sender wants to hear of the delivery.
      (Optional<Bool>, deliveryStatus, "D"),
      (Optional<VespOstrelProtocolDeliveryContext>, deliveryContext, "Dc"),
      (Optional<Int>, certifiedDeliveryVersion, "cdv"),
      (Optional<Data>, certifiedDeliveryRts, "cdr"),
      (Optional<Bool>, noResponseNeeded, "nr"),
      (Optional<Bool>, generateDeliveryReceipt, "gd"),
      // Who it is from and for. Tokens are opaque octets.
      (Optional<Data>, sessionToken, "sT"),
      (Optional<Data>, hearthSessionToken, "hT"),
      (Optional<String>, destinationId, "tP"),
      (Optional<String>, userAgent, "ua"),
      // An attachment in the chunk store: owner, signature, length in octets, and where to fetch or
      // put it. Its expiry is in nanoseconds, as the sender counts.
      (Optional<String>, BCSOwnerId, "mO"),
      (Optional<Data>, BCSFileSignature, "mS"),
      (Optional<Int64>, BCSFileLength, "mL"),
      (Optional<String>, BCSAuthToken, "mA"),
      (Optional<String>, BCSAuthUrl, "mR"),
      (Optional<String>, BCSAuthId, "mU"),
      (Optional<Array<String>>, BCSDownloadAuthList, "dal"),
      (Optional<Array<String>>, BCSDownloadUrlList, "dul"),
      (Optional<String>, BCSDownloadUrl, "dR"),
      (Optional<String>, BCSUploadUrl, "uR"),
      (Optional<Int64>, BCSExpiryNanos, "mX"),
      // What surrounds the attachment.
      (Optional<Int>, contentVersion, "cV"),
      (Optional<String>, contentHeaders, "cH"),
      (Optional<Data>, contentBody, "cB"),
      (Optional<Data>, contentReferenceSignature, "cR"),
      (Optional<Int>, attachmentSize, "mT"),
      // Addresses of the exchange.
      (Optional<Data>, token, "t"),
      (Optional<String>, senderId, "sP"),
      (Optional<String>, senderOpaqueId, "sI"),
      (Optional<String>, mspId, "mP"),
      // How an exchange went. Times are in nanoseconds, as the sender counts them.
      (Optional<Int>, responseStatus, "s"),
      (Optional<Int64>, epochTimeNanos, "e"),
      (Optional<Int64>, originalEpochTimeNanos, "oe"),
      // What failed, if something did.
      (Optional<Int>, failReason, "fR"),
      (Optional<Data>, failMessageId, "fU"),
      (Optional<String>, failMessageIdString, "fM"),
      (Optional<Int>, failDownloadAttachmentSize, "fFS"),
      (Optional<Int>, failUploadAttachmentSize, "fS"),
      (Optional<String>, failReasonMessage, "fRM"),
      (Optional<Int64>, failTimeElapsed, "fTE"),
      // How to keep and treat the message.
      (Optional<String>, encryptionType, "E"),
      (Optional<Int>, storageFlags, "H"),
      (Optional<Int>, priority, "pri"),
      // Deliberate: an integer and no boolean, like allowGDR.
      (Optional<Int>, senderExpectsAck, "ack"),
      // Payloads inside this one: a copy for each destination, and a bulk of messages.
      (Optional<Array<VespOstrelProtocolPayload>>, dstIdTokenList, "dtl"),
      (Optional<Array<VespOstrelProtocolPayload>>, ostrelMessageList, "mml"),
      // Limits and switches of the delivery.
      (Optional<Int>, storageCheckVersion, "scv"),
      (Optional<Int64>, dateExpirationSeconds, "eX"),
      (Optional<Int>, ostrelProtocol, "xp"),
      (Optional<Bool>, internalBuild, "x-internal"),
      (Optional<Bool>, loggingProfile, "x-logging"),
      (Optional<Bool>, traceProfile, "x-trace"),
      (Optional<Bool>, groupMessage, "gm"),
      (Optional<String>, contentType, "cT"),
      // Deliberate: the six header values stand here and, independently, inside httpHeaders.
      (Optional<String>, adhocServiceOverride, "aS"),
      (Optional<Data>, responseIdentifier, "rI"),
      (Optional<String>, responseIdentifierString, "ri"),
      (Optional<String>, strictTransportSecurity, "strict-transport-security"),
      (Optional<String>, traceId, "x-b3-traceid"),
      (Optional<String>, splunkHint, "sh"),
      (Optional<String>, asHttpHeader, "as"),
      // Reports, retries and the parts of a fan-out.
      (Optional<Int>, hearthDeliveryStatus, "hD"),
      (Optional<String>, hearthReportId, "hI"),
      (Optional<Int>, retryCount, "rc"),
      (Optional<String>, testOptions, "x-test-opts"),
      (Optional<Int>, fanoutChunkNumber, "fcn"),
      (Optional<Bool>, fanoutLastChunk, "flc"),
      (Optional<String>, url),
      (Optional<Int>, visoRetryCount, "frc"),
      // An HTTP exchange in a tunnel.
      (Optional<Int>, webtunnelVersion, "wV"),
      (Optional<String>, httpUrl, "u"),
      (Optional<VespOstrelProtocolHttpHeaders>, httpHeaders, "h"),
      (Optional<Data>, httpBody, "b"),
      (Optional<String>, httpBodyUrl, "bu"),
      (Optional<Data>, httpBodyKey, "bk"),
      (Optional<Int>, httpResponseStatus, "hs"),
      (Optional<String>, httpErrorMsg, "hr"),
      // More switches of the delivery.
      (Optional<Bool>, writeToSkyvault, "sv"),
      (Optional<Bool>, pessimisticCheck, "x-pessimistic"),
      (Optional<Bool>, unfilteredHeaders, "nH"),
      (Optional<Int>, deliveryStatusFlags, "O"),
      (Optional<String>, conferenceURI, "curi"),
      (Optional<Data>, selfSessionToken, "sst"),
      (Optional<Data>, queryHash, "qH"),
      (Optional<Int>, testDropPoint, "x-dp"),
      (Optional<Bool>, userPlusOne, "up1"),
      (Optional<Bool>, isInitiatorKey, "is-initiator-key"),
      // Media relays: who asks for which session, and why.
      (Optional<Int>, hoplineUserType, "qtu"),
      (Optional<Int>, errorCode, "eC"),
      (Optional<Bool>, messageCheckpoint, "mc"),
      (Optional<Int>, conversationId, "ci"),
      (Optional<Int>, protocolVersion, "qv"),
      (Optional<String>, applicationId, "qai"),
      (Optional<Int>, reason, "hl"),
      // The relay that was used before, and the one in use.
      (Optional<Int>, prevErrorCode, "qpec"),
      (Optional<Data>, prevAccessToken, "qpat"),
      (Optional<Data>, prevRelayIp, "qpip"),
      (Optional<Int>, prevTimestamp, "qpt"),
      (Optional<Data>, activeAccessToken, "qaat"),
      (Optional<Data>, activeRelayIp, "qaip"),
      (Optional<Int>, selfAllocTokenCountOld, "qsatc"),
      (Optional<Int>, selfAllocTokenCount, "qsats"),
      // Deliberate: the relay fields stand here and, independently, inside the relay records.
      (Optional<Array<VespHoplinePluginRequest>>, pluginRequests, "qplr"),
      (Optional<String>, pluginName, "qpln"),
      (Optional<String>, pluginConfig, "qplc"),
      (Optional<Int>, pluginStream, "qpls"),
      (Optional<Bool>, pluginDevMode, "qpld"),
      // The relay session that is asked for.
      (Optional<Bool>, hlNewSession, "qns"),
      (Optional<Int>, requestType, "qat"),
      (Optional<Data>, vespSessionId, "qvesp"),
      (Optional<Int>, relayProvider, "hlpr"),
      (Optional<Bool>, sharedSession, "hlss"),
      (Optional<String>, groupId, "qgid"),
      (Optional<Int>, groupMemberCount, "qgmc"),
      (Optional<Int>, allocateInfoAttribute, "qia"),
      // The relay that was given. Addresses are 4 or 16 octets as the sender has them.
      (Optional<Data>, relayIp, "hlip"),
      (Optional<Data>, relayIpv6, "hlip6"),
      (Optional<Int>, relayPort, "hlp"),
      (Optional<Data>, relayAccessToken, "hlst"),
      (Optional<Data>, relaySessionKey, "hlsk"),
      (Optional<Data>, relaySessionId, "hlsi"),
      // Times are in milliseconds, as the sender counts them.
      (Optional<Int64>, expiryEpochTimeMillis, "qe"),
      (Optional<Data>, initiatorIp, "qsi"),
      (Optional<UInt64>, participantId, "hli"),
      // What the relay is and how it is reached.
      (Optional<Data>, softwareVersion, "qswv"),
      (Optional<String>, relayBuildVersion, "hlbv"),
      (Optional<Int>, relayHighPriorityPort, "hlhpp"),
      (Optional<Int>, ipFamilyPreference, "qipp"),
      (Optional<Int64>, allocationEpochTimeMillis, "qsat"),
      // What became of the allocation, for one participant and for each.
      (Optional<Int>, allocationStatus, "hls"),
      (Optional<Array<VespHoplineAllocationStatus>>, allocationStatuses, "qal"),
      (Optional<Array<VespHoplineSelfAllocToken>>, selfAllocTokenList, "qsatv"),
      (Optional<Data>, relayReportingBlob, "hlep"),
      (Optional<Int>, relayServerType, "hlast"),
      (Optional<Array<VespHoplinePluginAllocation>>, pluginAllocations, "qpla"),
      // What an answer says of the command that it answers.
      (Optional<Int>, hlErrorCode, "qec"),
      (Optional<Int>, originalCommand, "oC"),
      (Optional<Bool>, isBulkedPayload, "iB"),
      (Optional<Bool>, wantsAppAck, "wA"),
      (Optional<String>, errorDomain, "eD"),
      (Optional<Bool>, expectsPeerResponse, "eR"),
      (Optional<Int>, allowGDR, "gdr"),
      (Optional<Int>, sendMode, "sm"),
      // Whom the device knows the sender as.
      (Optional<Bool>, isTrustedSender, "htu"),
      (Optional<Bool>, isUPlusOneKey, "is-u-plus-one-key"));
};

static_assert(VespOstrelProtocolPayload::CodingKeys::size == 156);

}  // namespace VespKeelgateService
