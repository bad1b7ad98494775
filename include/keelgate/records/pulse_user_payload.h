// SPDX-License-Identifier: Apache-2.0
/// The record of a push payload, and the records inside it. Values that own all that they hold;
/// separate ones may be used from separate threads.
///
/// Numbers are the sender's codes and counts, checked only for their type and 64-bit range.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

namespace Keelgate {

/// How often the delivery has been attempted.
struct PulseUserPayloadDeliveryContext {
  KEELGATE_RECORD(PulseUserPayloadDeliveryContext,
      (Optional<Int>, count));
};

/// A plugin that a media relay is asked to run.
struct PulseHoplinePluginRequest {
  KEELGATE_RECORD(PulseHoplinePluginRequest,
      (Optional<String>, pluginName),
      (Optional<String>, pluginConfig),
      (Optional<Int>, pluginStream),
      (Optional<Bool>, pluginDevMode));
};

/// What a media relay answered for one participant. Participants are unsigned 64-bit numbers: as
/// signed ones, half of them would be negative.
struct PulseHoplineAllocationStatus {
  KEELGATE_RECORD(PulseHoplineAllocationStatus,
      (Optional<UInt64>, participantId),
      (Optional<Int>, allocationStatus),
      (Optional<Data>, token),
      (Optional<String>, destinationId));
};

/// What a device needs to allocate a relay by itself. Addresses and keys are raw octets. Their
/// lengths are the sender's, and a port may be any integer.
struct PulseHoplineSelfAllocToken {
  KEELGATE_RECORD(PulseHoplineSelfAllocToken,
      (Optional<Data>, relayIp),
      (Optional<Data>, relayIpv6),
      (Optional<Int>, relayPort),
      (Optional<Data>, relaySessionKey),
      (Optional<Data>, relaySessionId),
      (Optional<Data>, relayAccessToken),
      (Optional<Int>, relayProvider));
};

/// A plugin that a media relay runs.
struct PulseHoplinePluginAllocation {
  KEELGATE_RECORD(PulseHoplinePluginAllocation,
      (Optional<String>, pluginName),
      (Optional<Int>, pluginStream),
      (Optional<UInt64>, participantId),
      (Optional<Data>, relaySessionKey),
      (Optional<Data>, relayAccessToken));
};

/// One push payload. The two payload lists and the four relay lists are empty where the message had
/// none; everything else that the message lacked is absent. Payloads nest at most 256 deep, half as
/// deep as property lists do.
///
/// A recursive walk needs enough stack for that, or a limit of its own: a message of a few KB can
/// nest to the full depth.
struct PulseUserPayload {
  KEELGATE_RECORD(PulseUserPayload,
      /// What the payload is: the only field that is always present.
      (Int, command),
      (Optional<Int>, commandContext),
      (Optional<Int>, version),
      /// The content, encrypted by its sender, in one of several wrappings. Opaque to the service,
      /// which has no key.
      (Optional<Data>, payload),
      (Optional<Data>, bulkedPayload),
      (Optional<Data>, fanoutPayload),
      (Optional<Data>, additionalPayload),
      (Optional<Data>, payloadMetadata),
      /// Which message it is, and where it waited.
      (Optional<String>, messageId),
      (Optional<Data>, messageUUID),
      (Optional<String>, queueId),
      /// Receipts: what the sender wants to hear of the delivery.
      (Optional<Bool>, deliveryStatus),
      (Optional<PulseUserPayloadDeliveryContext>, deliveryContext),
      (Optional<Int>, certifiedDeliveryVersion),
      (Optional<Data>, certifiedDeliveryRts),
      (Optional<Bool>, noResponseNeeded),
      (Optional<Bool>, generateDeliveryReceipt),
      /// Who it is from and for. Tokens are opaque octets.
      (Optional<Data>, sessionToken),
      (Optional<Data>, hearthSessionToken),
      (Optional<String>, destinationId),
      (Optional<String>, userAgent),
      /// An attachment in the chunk store: owner, signature, length in octets, and where to fetch
      /// or put it. Its expiry is in nanoseconds, as the sender counts. URLs here and below are any
      /// text that the sender chose: fetching one tells its owner that the message was read, and
      /// from where.
      (Optional<String>, BCSOwnerId),
      (Optional<Data>, BCSFileSignature),
      (Optional<Int64>, BCSFileLength),
      (Optional<String>, BCSAuthToken),
      (Optional<String>, BCSAuthUrl),
      (Optional<String>, BCSAuthId),
      (Optional<Array<String>>, BCSDownloadAuthList),
      (Optional<Array<String>>, BCSDownloadUrlList),
      (Optional<String>, BCSDownloadUrl),
      (Optional<String>, BCSUploadUrl),
      (Optional<Int64>, BCSExpiryNanos),
      /// What surrounds the attachment.
      (Optional<Int>, contentVersion),
      (Optional<String>, contentHeaders),
      (Optional<Data>, contentBody),
      (Optional<Data>, contentReferenceSignature),
      (Optional<Int>, attachmentSize),
      /// Addresses of the exchange.
      (Optional<Data>, token),
      (Optional<String>, senderId),
      (Optional<String>, senderOpaqueId),
      (Optional<String>, mspId),
      /// How an exchange went. Times are in nanoseconds, as the sender counts them.
      (Optional<Int>, responseStatus),
      (Optional<Int64>, epochTimeNanos),
      (Optional<Int64>, originalEpochTimeNanos),
      /// What failed, if something did.
      (Optional<Int>, failReason),
      (Optional<Data>, failMessageId),
      (Optional<String>, failMessageIdString),
      (Optional<Int>, failDownloadAttachmentSize),
      (Optional<Int>, failUploadAttachmentSize),
      (Optional<String>, failReasonMessage),
      (Optional<Int64>, failTimeElapsed),
      /// How to keep and treat the message.
      (Optional<String>, encryptionType),
      (Optional<Int>, storageFlags),
      (Optional<Int>, priority),
      (Optional<Int>, senderExpectsAck),
      /// Payloads inside this one: a copy for each destination, and a bulk of messages.
      (Array<PulseUserPayload>, dstIdTokenList),
      (Array<PulseUserPayload>, ostrelMessageList),
      /// Limits and switches of the delivery.
      (Optional<Int>, storageCheckVersion),
      (Optional<Int64>, dateExpirationSeconds),
      (Optional<Int>, ostrelProtocol),
      /// The next three may ask for more to be logged or traced. The request comes from a stranger.
      (Optional<Bool>, internalBuild),
      (Optional<Bool>, loggingProfile),
      (Optional<Bool>, traceProfile),
      (Optional<Bool>, groupMessage),
      (Optional<String>, contentType),
      /// Header values outside of httpHeaders, which has those of a tunnelled exchange. A message
      /// may have both, and neither replaces the other.
      (Optional<String>, adhocServiceOverride),
      (Optional<Data>, responseIdentifier),
      (Optional<String>, responseIdentifierString),
      (Optional<String>, strictTransportSecurity),
      (Optional<String>, traceId),
      (Optional<String>, splunkHint),
      (Optional<String>, asHttpHeader),
      /// Reports, retries and the parts of a fan-out.
      (Optional<Int>, hearthDeliveryStatus),
      (Optional<String>, hearthReportId),
      (Optional<Int>, retryCount),
      (Optional<String>, testOptions),
      (Optional<Int>, fanoutChunkNumber),
      (Optional<Bool>, fanoutLastChunk),
      (Optional<String>, url),
      (Optional<Int>, visoRetryCount),
      /// An HTTP exchange in a tunnel.
      (Optional<Int>, webtunnelVersion),
      (Optional<String>, httpUrl),
      (Optional<PulseUserPayloadHttpHeaders>, httpHeaders),
      (Optional<Data>, httpBody),
      (Optional<String>, httpBodyUrl),
      (Optional<Data>, httpBodyKey),
      (Optional<Int>, httpResponseStatus),
      (Optional<String>, httpErrorMsg),
      /// More switches of the delivery.
      (Optional<Bool>, writeToSkyvault),
      (Optional<Bool>, pessimisticCheck),
      (Optional<Bool>, unfilteredHeaders),
      (Optional<Int>, deliveryStatusFlags),
      (Optional<String>, conferenceURI),
      (Optional<Data>, selfSessionToken),
      (Optional<Data>, queryHash),
      (Optional<Int>, testDropPoint),
      (Optional<Bool>, userPlusOne),
      (Optional<Bool>, isInitiatorKey),
      /// Media relays: who asks for which session, and why.
      (Optional<Int>, hoplineUserType),
      (Optional<Int>, errorCode),
      (Optional<Bool>, messageCheckpoint),
      (Optional<Int>, conversationId),
      (Optional<Int>, protocolVersion),
      (Optional<String>, applicationId),
      (Optional<Int>, reason),
      /// The relay that was used before, and the one in use.
      (Optional<Int>, prevErrorCode),
      (Optional<Data>, prevAccessToken),
      (Optional<Data>, prevRelayIp),
      (Optional<Int>, prevTimestamp),
      (Optional<Data>, activeAccessToken),
      (Optional<Data>, activeRelayIp),
      (Optional<Int>, selfAllocTokenCountOld),
      (Optional<Int>, selfAllocTokenCount),
      /// Plugins: several that are requested together, and independently of them a single one.
      (Array<PulseHoplinePluginRequest>, pluginRequests),
      (Optional<String>, pluginName),
      (Optional<String>, pluginConfig),
      (Optional<Int>, pluginStream),
      (Optional<Bool>, pluginDevMode),
      /// The relay session that is requested.
      (Optional<Bool>, hlNewSession),
      (Optional<Int>, requestType),
      (Optional<Data>, vespSessionId),
      (Optional<Int>, relayProvider),
      (Optional<Bool>, sharedSession),
      (Optional<String>, groupId),
      (Optional<Int>, groupMemberCount),
      (Optional<Int>, allocateInfoAttribute),
      /// The relay that was given. Addresses are 4 or 16 octets as the sender has them.
      (Optional<Data>, relayIp),
      (Optional<Data>, relayIpv6),
      (Optional<Int>, relayPort),
      (Optional<Data>, relayAccessToken),
      (Optional<Data>, relaySessionKey),
      (Optional<Data>, relaySessionId),
      /// Times are in milliseconds, as the sender counts them.
      (Optional<Int64>, expiryEpochTimeMillis),
      (Optional<Data>, initiatorIp),
      (Optional<UInt64>, participantId),
      /// What the relay is and how it is reached.
      (Optional<Data>, softwareVersion),
      (Optional<String>, relayBuildVersion),
      (Optional<Int>, relayHighPriorityPort),
      (Optional<Int>, ipFamilyPreference),
      (Optional<Int64>, allocationEpochTimeMillis),
      /// The result of the allocation, for one participant and for each.
      (Optional<Int>, allocationStatus),
      (Array<PulseHoplineAllocationStatus>, allocationStatuses),
      (Array<PulseHoplineSelfAllocToken>, selfAllocTokenList),
      (Optional<Data>, relayReportingBlob),
      (Optional<Int>, relayServerType),
      (Array<PulseHoplinePluginAllocation>, pluginAllocations),
      /// What an answer says about its command.
      (Optional<Int>, hlErrorCode),
      (Optional<Int>, originalCommand),
      (Optional<Bool>, isBulkedPayload),
      (Optional<Bool>, wantsAppAck),
      (Optional<String>, errorDomain),
      (Optional<Bool>, expectsPeerResponse),
      (Optional<Int>, allowGDR),
      (Optional<Int>, sendMode),
      /// Who the sender claims to be on this device: like all else in the message, it proves
      /// nothing.
      (Optional<Bool>, isTrustedSender),
      (Optional<Bool>, isUPlusOneKey));
};

}  // namespace Keelgate
