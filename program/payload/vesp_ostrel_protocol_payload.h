// SPDX-License-Identifier: Apache-2.0
/// The push payload: message delivery, attachments, web-tunnel exchanges, receipts and media relays
/// in one flat dictionary. Only the command is required. Keys are case-sensitive: "h" and "H", "ri"
/// and "rI" are different fields. Payloads nest in payloads, as deep as property lists do.
#pragma once

#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Values are decoded and never combined: no field decides whether another counts, and no list has
/// a length that another must have.
struct VespOstrelProtocolPayload {
  // What the payload is: the one field that is always there.
  FIELD(Int, command, "c");
  FIELD(Optional<Int>, commandContext, "cc");
  FIELD(Optional<Int>, version, "v");
  // The content, encrypted by its sender, in one of several wrappings.
  FIELD(Optional<Data>, payload, "P");
  FIELD(Optional<Data>, bulkedPayload, "N");
  FIELD(Optional<Data>, fanoutPayload, "fP");
  FIELD(Optional<Data>, additionalPayload, "aP");
  FIELD(Optional<Data>, payloadMetadata, "Pm");
  // Deliberate: a string here, an integer in the answers to commands.
  FIELD(Optional<String>, messageId, "i");
  FIELD(Optional<Data>, messageUUID, "U");
  FIELD(Optional<String>, queueId, "qI");
  // Receipts: what the sender wants to hear of the delivery.
  FIELD(Optional<Bool>, deliveryStatus, "D");
  FIELD(Optional<VespOstrelProtocolDeliveryContext>, deliveryContext, "Dc");
  FIELD(Optional<Int>, certifiedDeliveryVersion, "cdv");
  FIELD(Optional<Data>, certifiedDeliveryRts, "cdr");
  FIELD(Optional<Bool>, noResponseNeeded, "nr");
  FIELD(Optional<Bool>, generateDeliveryReceipt, "gd");
  // Who it is from and for. Tokens are opaque octets.
  FIELD(Optional<Data>, sessionToken, "sT");
  FIELD(Optional<Data>, hearthSessionToken, "hT");
  FIELD(Optional<String>, destinationId, "tP");
  FIELD(Optional<String>, userAgent, "ua");
  // An attachment in the chunk store: owner, signature, length in octets, and where to fetch or
  // put it. Its expiry is in nanoseconds, as the sender counts.
  FIELD(Optional<String>, BCSOwnerId, "mO");
  FIELD(Optional<Data>, BCSFileSignature, "mS");
  FIELD(Optional<Int64>, BCSFileLength, "mL");
  FIELD(Optional<String>, BCSAuthToken, "mA");
  FIELD(Optional<String>, BCSAuthUrl, "mR");
  FIELD(Optional<String>, BCSAuthId, "mU");
  FIELD(Optional<Array<String>>, BCSDownloadAuthList, "dal");
  FIELD(Optional<Array<String>>, BCSDownloadUrlList, "dul");
  FIELD(Optional<String>, BCSDownloadUrl, "dR");
  FIELD(Optional<String>, BCSUploadUrl, "uR");
  FIELD(Optional<Int64>, BCSExpiryNanos, "mX");
  // What surrounds the attachment.
  FIELD(Optional<Int>, contentVersion, "cV");
  FIELD(Optional<String>, contentHeaders, "cH");
  FIELD(Optional<Data>, contentBody, "cB");
  FIELD(Optional<Data>, contentReferenceSignature, "cR");
  FIELD(Optional<Int>, attachmentSize, "mT");
  // Addresses of the exchange.
  FIELD(Optional<Data>, token, "t");
  FIELD(Optional<String>, senderId, "sP");
  FIELD(Optional<String>, senderOpaqueId, "sI");
  FIELD(Optional<String>, mspId, "mP");
  // How an exchange went. Times are in nanoseconds, as the sender counts them.
  FIELD(Optional<Int>, responseStatus, "s");
  FIELD(Optional<Int64>, epochTimeNanos, "e");
  FIELD(Optional<Int64>, originalEpochTimeNanos, "oe");
  // What failed, if something did.
  FIELD(Optional<Int>, failReason, "fR");
  FIELD(Optional<Data>, failMessageId, "fU");
  FIELD(Optional<String>, failMessageIdString, "fM");
  FIELD(Optional<Int>, failDownloadAttachmentSize, "fFS");
  FIELD(Optional<Int>, failUploadAttachmentSize, "fS");
  FIELD(Optional<String>, failReasonMessage, "fRM");
  FIELD(Optional<Int64>, failTimeElapsed, "fTE");
  // How to keep and treat the message.
  FIELD(Optional<String>, encryptionType, "E");
  FIELD(Optional<Int>, storageFlags, "H");
  FIELD(Optional<Int>, priority, "pri");
  // Deliberate: an integer and no boolean, like allowGDR.
  FIELD(Optional<Int>, senderExpectsAck, "ack");
  // Payloads inside this one: a copy for each destination, and a bulk of messages.
  FIELD(Optional<Array<VespOstrelProtocolPayload>>, dstIdTokenList, "dtl");
  FIELD(Optional<Array<VespOstrelProtocolPayload>>, ostrelMessageList, "mml");
  // Limits and switches of the delivery.
  FIELD(Optional<Int>, storageCheckVersion, "scv");
  FIELD(Optional<Int64>, dateExpirationSeconds, "eX");
  FIELD(Optional<Int>, ostrelProtocol, "xp");
  FIELD(Optional<Bool>, internalBuild, "x-internal");
  FIELD(Optional<Bool>, loggingProfile, "x-logging");
  FIELD(Optional<Bool>, traceProfile, "x-trace");
  FIELD(Optional<Bool>, groupMessage, "gm");
  FIELD(Optional<String>, contentType, "cT");
  // Deliberate: the six header values stand here and, independently, inside httpHeaders.
  FIELD(Optional<String>, adhocServiceOverride, "aS");
  FIELD(Optional<Data>, responseIdentifier, "rI");
  FIELD(Optional<String>, responseIdentifierString, "ri");
  FIELD(Optional<String>, strictTransportSecurity, "strict-transport-security");
  FIELD(Optional<String>, traceId, "x-b3-traceid");
  FIELD(Optional<String>, splunkHint, "sh");
  FIELD(Optional<String>, asHttpHeader, "as");
  // Reports, retries and the parts of a fan-out.
  FIELD(Optional<Int>, hearthDeliveryStatus, "hD");
  FIELD(Optional<String>, hearthReportId, "hI");
  FIELD(Optional<Int>, retryCount, "rc");
  FIELD(Optional<String>, testOptions, "x-test-opts");
  FIELD(Optional<Int>, fanoutChunkNumber, "fcn");
  FIELD(Optional<Bool>, fanoutLastChunk, "flc");
  FIELD(Optional<String>, url);
  FIELD(Optional<Int>, visoRetryCount, "frc");
  // An HTTP exchange in a tunnel.
  FIELD(Optional<Int>, webtunnelVersion, "wV");
  FIELD(Optional<String>, httpUrl, "u");
  FIELD(Optional<VespOstrelProtocolHttpHeaders>, httpHeaders, "h");
  FIELD(Optional<Data>, httpBody, "b");
  FIELD(Optional<String>, httpBodyUrl, "bu");
  FIELD(Optional<Data>, httpBodyKey, "bk");
  FIELD(Optional<Int>, httpResponseStatus, "hs");
  FIELD(Optional<String>, httpErrorMsg, "hr");
  // More switches of the delivery.
  FIELD(Optional<Bool>, writeToSkyvault, "sv");
  FIELD(Optional<Bool>, pessimisticCheck, "x-pessimistic");
  FIELD(Optional<Bool>, unfilteredHeaders, "nH");
  FIELD(Optional<Int>, deliveryStatusFlags, "O");
  FIELD(Optional<String>, conferenceURI, "curi");
  FIELD(Optional<Data>, selfSessionToken, "sst");
  FIELD(Optional<Data>, queryHash, "qH");
  FIELD(Optional<Int>, testDropPoint, "x-dp");
  FIELD(Optional<Bool>, userPlusOne, "up1");
  FIELD(Optional<Bool>, isInitiatorKey, "is-initiator-key");
  // Media relays: who asks for which session, and why.
  FIELD(Optional<Int>, hoplineUserType, "qtu");
  FIELD(Optional<Int>, errorCode, "eC");
  FIELD(Optional<Bool>, messageCheckpoint, "mc");
  FIELD(Optional<Int>, conversationId, "ci");
  FIELD(Optional<Int>, protocolVersion, "qv");
  FIELD(Optional<String>, applicationId, "qai");
  FIELD(Optional<Int>, reason, "hl");
  // The relay that was used before, and the one in use.
  FIELD(Optional<Int>, prevErrorCode, "qpec");
  FIELD(Optional<Data>, prevAccessToken, "qpat");
  FIELD(Optional<Data>, prevRelayIp, "qpip");
  FIELD(Optional<Int>, prevTimestamp, "qpt");
  FIELD(Optional<Data>, activeAccessToken, "qaat");
  FIELD(Optional<Data>, activeRelayIp, "qaip");
  FIELD(Optional<Int>, selfAllocTokenCountOld, "qsatc");
  FIELD(Optional<Int>, selfAllocTokenCount, "qsats");
  // Deliberate: the relay fields stand here and, independently, inside the relay records.
  FIELD(Optional<Array<VespHoplinePluginRequest>>, pluginRequests, "qplr");
  FIELD(Optional<String>, pluginName, "qpln");
  FIELD(Optional<String>, pluginConfig, "qplc");
  FIELD(Optional<Int>, pluginStream, "qpls");
  FIELD(Optional<Bool>, pluginDevMode, "qpld");
  // The relay session that is asked for.
  FIELD(Optional<Bool>, hlNewSession, "qns");
  FIELD(Optional<Int>, requestType, "qat");
  FIELD(Optional<Data>, vespSessionId, "qvesp");
  FIELD(Optional<Int>, relayProvider, "hlpr");
  FIELD(Optional<Bool>, sharedSession, "hlss");
  FIELD(Optional<String>, groupId, "qgid");
  FIELD(Optional<Int>, groupMemberCount, "qgmc");
  FIELD(Optional<Int>, allocateInfoAttribute, "qia");
  // The relay that was given. Addresses are 4 or 16 octets as the sender has them.
  FIELD(Optional<Data>, relayIp, "hlip");
  FIELD(Optional<Data>, relayIpv6, "hlip6");
  FIELD(Optional<Int>, relayPort, "hlp");
  FIELD(Optional<Data>, relayAccessToken, "hlst");
  FIELD(Optional<Data>, relaySessionKey, "hlsk");
  FIELD(Optional<Data>, relaySessionId, "hlsi");
  // Times are in milliseconds, as the sender counts them.
  FIELD(Optional<Int64>, expiryEpochTimeMillis, "qe");
  FIELD(Optional<Data>, initiatorIp, "qsi");
  FIELD(Optional<UInt64>, participantId, "hli");
  // What the relay is and how it is reached.
  FIELD(Optional<Data>, softwareVersion, "qswv");
  FIELD(Optional<String>, relayBuildVersion, "hlbv");
  FIELD(Optional<Int>, relayHighPriorityPort, "hlhpp");
  FIELD(Optional<Int>, ipFamilyPreference, "qipp");
  FIELD(Optional<Int64>, allocationEpochTimeMillis, "qsat");
  // What became of the allocation, for one participant and for each.
  FIELD(Optional<Int>, allocationStatus, "hls");
  FIELD(Optional<Array<VespHoplineAllocationStatus>>, allocationStatuses, "qal");
  FIELD(Optional<Array<VespHoplineSelfAllocToken>>, selfAllocTokenList, "qsatv");
  FIELD(Optional<Data>, relayReportingBlob, "hlep");
  FIELD(Optional<Int>, relayServerType, "hlast");
  FIELD(Optional<Array<VespHoplinePluginAllocation>>, pluginAllocations, "qpla");
  // What an answer says of the command that it answers.
  FIELD(Optional<Int>, hlErrorCode, "qec");
  FIELD(Optional<Int>, originalCommand, "oC");
  FIELD(Optional<Bool>, isBulkedPayload, "iB");
  FIELD(Optional<Bool>, wantsAppAck, "wA");
  FIELD(Optional<String>, errorDomain, "eD");
  FIELD(Optional<Bool>, expectsPeerResponse, "eR");
  FIELD(Optional<Int>, allowGDR, "gdr");
  FIELD(Optional<Int>, sendMode, "sm");
  // Whom the device knows the sender as.
  FIELD(Optional<Bool>, isTrustedSender, "htu");
  FIELD(Optional<Bool>, isUPlusOneKey, "is-u-plus-one-key");

  CODING_KEYS(VespOstrelProtocolPayload);
};

static_assert(VespOstrelProtocolPayload::CodingKeys::size == 156);

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
