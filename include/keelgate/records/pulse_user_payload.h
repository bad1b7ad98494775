// SPDX-License-Identifier: Apache-2.0
/// The record of a push payload, and the records inside it. Values that own all that they hold;
/// separate ones may be used from separate threads.
///
/// Numbers are the sender's codes and counts, checked for their type and their 64 bits alone.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// How often the delivery was tried.
struct PulseUserPayloadDeliveryContext {
  FIELD(Optional<Int>, count);

  LABELS(PulseUserPayloadDeliveryContext);
};

/// A plugin that a media relay is asked to run.
struct PulseHoplinePluginRequest {
  FIELD(Optional<String>, pluginName);
  FIELD(Optional<String>, pluginConfig);
  FIELD(Optional<Int>, pluginStream);
  FIELD(Optional<Bool>, pluginDevMode);

  LABELS(PulseHoplinePluginRequest);
};

/// What a media relay answered for one participant. The participant is a number of 64 bits without
/// sign: read as a signed one, half of them would turn negative.
struct PulseHoplineAllocationStatus {
  FIELD(Optional<UInt64>, participantId);
  FIELD(Optional<Int>, allocationStatus);
  FIELD(Optional<Data>, token);
  FIELD(Optional<String>, destinationId);

  LABELS(PulseHoplineAllocationStatus);
};

/// What a device needs to allocate a relay by itself. Addresses and keys are raw octets. Their
/// lengths are the sender's, and a port may be any integer.
struct PulseHoplineSelfAllocToken {
  FIELD(Optional<Data>, relayIp);
  FIELD(Optional<Data>, relayIpv6);
  FIELD(Optional<Int>, relayPort);
  FIELD(Optional<Data>, relaySessionKey);
  FIELD(Optional<Data>, relaySessionId);
  FIELD(Optional<Data>, relayAccessToken);
  FIELD(Optional<Int>, relayProvider);

  LABELS(PulseHoplineSelfAllocToken);
};

/// A plugin that a media relay runs.
struct PulseHoplinePluginAllocation {
  FIELD(Optional<String>, pluginName);
  FIELD(Optional<Int>, pluginStream);
  FIELD(Optional<UInt64>, participantId);
  FIELD(Optional<Data>, relaySessionKey);
  FIELD(Optional<Data>, relayAccessToken);

  LABELS(PulseHoplinePluginAllocation);
};

/// One push payload. The two payload lists and the four relay lists are empty where the message had
/// none; everything else that the message lacked is absent. Payloads nest at most as deep as
/// property lists may, which is 256.
///
/// Whoever walks it depth first by recursion needs a stack for that, or a limit of its own: a
/// message of some KB nests to the full depth.
struct PulseUserPayload {
  /// What the payload is: the one field that is always there.
  FIELD(Int, command);
  FIELD(Optional<Int>, commandContext);
  FIELD(Optional<Int>, version);
  /// The content, encrypted by its sender, in one of several wrappings. Opaque to the service,
  /// which has no key.
  FIELD(Optional<Data>, payload);
  FIELD(Optional<Data>, bulkedPayload);
  FIELD(Optional<Data>, fanoutPayload);
  FIELD(Optional<Data>, additionalPayload);
  FIELD(Optional<Data>, payloadMetadata);
  /// Which message it is, and where it waited.
  FIELD(Optional<String>, messageId);
  FIELD(Optional<Data>, messageUUID);
  FIELD(Optional<String>, queueId);
  /// Receipts: what the sender wants to hear of the delivery.
  FIELD(Optional<Bool>, deliveryStatus);
  FIELD(Optional<PulseUserPayloadDeliveryContext>, deliveryContext);
  FIELD(Optional<Int>, certifiedDeliveryVersion);
  FIELD(Optional<Data>, certifiedDeliveryRts);
  FIELD(Optional<Bool>, noResponseNeeded);
  FIELD(Optional<Bool>, generateDeliveryReceipt);
  /// Who it is from and for. Tokens are opaque octets.
  FIELD(Optional<Data>, sessionToken);
  FIELD(Optional<Data>, hearthSessionToken);
  FIELD(Optional<String>, destinationId);
  FIELD(Optional<String>, userAgent);
  /// An attachment in the chunk store: owner, signature, length in octets, and where to fetch or
  /// put it. Its expiry is in nanoseconds, as the sender counts. URLs here and below are any text
  /// that the sender chose: whoever fetches one shows its owner that the message was read, and from
  /// where.
  FIELD(Optional<String>, BCSOwnerId);
  FIELD(Optional<Data>, BCSFileSignature);
  FIELD(Optional<Int64>, BCSFileLength);
  FIELD(Optional<String>, BCSAuthToken);
  FIELD(Optional<String>, BCSAuthUrl);
  FIELD(Optional<String>, BCSAuthId);
  FIELD(Optional<Array<String>>, BCSDownloadAuthList);
  FIELD(Optional<Array<String>>, BCSDownloadUrlList);
  FIELD(Optional<String>, BCSDownloadUrl);
  FIELD(Optional<String>, BCSUploadUrl);
  FIELD(Optional<Int64>, BCSExpiryNanos);
  /// What surrounds the attachment.
  FIELD(Optional<Int>, contentVersion);
  FIELD(Optional<String>, contentHeaders);
  FIELD(Optional<Data>, contentBody);
  FIELD(Optional<Data>, contentReferenceSignature);
  FIELD(Optional<Int>, attachmentSize);
  /// Addresses of the exchange.
  FIELD(Optional<Data>, token);
  FIELD(Optional<String>, senderId);
  FIELD(Optional<String>, senderOpaqueId);
  FIELD(Optional<String>, mspId);
  /// How an exchange went. Times are in nanoseconds, as the sender counts them.
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<Int64>, epochTimeNanos);
  FIELD(Optional<Int64>, originalEpochTimeNanos);
  /// What failed, if something did.
  FIELD(Optional<Int>, failReason);
  FIELD(Optional<Data>, failMessageId);
  FIELD(Optional<String>, failMessageIdString);
  FIELD(Optional<Int>, failDownloadAttachmentSize);
  FIELD(Optional<Int>, failUploadAttachmentSize);
  FIELD(Optional<String>, failReasonMessage);
  FIELD(Optional<Int64>, failTimeElapsed);
  /// How to keep and treat the message.
  FIELD(Optional<String>, encryptionType);
  FIELD(Optional<Int>, storageFlags);
  FIELD(Optional<Int>, priority);
  FIELD(Optional<Int>, senderExpectsAck);
  /// Payloads inside this one: a copy for each destination, and a bulk of messages.
  FIELD(Array<PulseUserPayload>, dstIdTokenList);
  FIELD(Array<PulseUserPayload>, ostrelMessageList);
  /// Limits and switches of the delivery.
  FIELD(Optional<Int>, storageCheckVersion);
  FIELD(Optional<Int64>, dateExpirationSeconds);
  FIELD(Optional<Int>, ostrelProtocol);
  /// The next three may ask for more to be logged or traced. It is a stranger who asks.
  FIELD(Optional<Bool>, internalBuild);
  FIELD(Optional<Bool>, loggingProfile);
  FIELD(Optional<Bool>, traceProfile);
  FIELD(Optional<Bool>, groupMessage);
  FIELD(Optional<String>, contentType);
  /// Header values that stand by themselves; those of a tunnelled exchange are in httpHeaders. A
  /// message may bring both, and neither fills in for the other.
  FIELD(Optional<String>, adhocServiceOverride);
  FIELD(Optional<Data>, responseIdentifier);
  FIELD(Optional<String>, responseIdentifierString);
  FIELD(Optional<String>, strictTransportSecurity);
  FIELD(Optional<String>, traceId);
  FIELD(Optional<String>, splunkHint);
  FIELD(Optional<String>, asHttpHeader);
  /// Reports, retries and the parts of a fan-out.
  FIELD(Optional<Int>, hearthDeliveryStatus);
  FIELD(Optional<String>, hearthReportId);
  FIELD(Optional<Int>, retryCount);
  FIELD(Optional<String>, testOptions);
  FIELD(Optional<Int>, fanoutChunkNumber);
  FIELD(Optional<Bool>, fanoutLastChunk);
  FIELD(Optional<String>, url);
  FIELD(Optional<Int>, visoRetryCount);
  /// An HTTP exchange in a tunnel.
  FIELD(Optional<Int>, webtunnelVersion);
  FIELD(Optional<String>, httpUrl);
  FIELD(Optional<PulseUserPayloadHttpHeaders>, httpHeaders);
  FIELD(Optional<Data>, httpBody);
  FIELD(Optional<String>, httpBodyUrl);
  FIELD(Optional<Data>, httpBodyKey);
  FIELD(Optional<Int>, httpResponseStatus);
  FIELD(Optional<String>, httpErrorMsg);
  /// More switches of the delivery.
  FIELD(Optional<Bool>, writeToSkyvault);
  FIELD(Optional<Bool>, pessimisticCheck);
  FIELD(Optional<Bool>, unfilteredHeaders);
  FIELD(Optional<Int>, deliveryStatusFlags);
  FIELD(Optional<String>, conferenceURI);
  FIELD(Optional<Data>, selfSessionToken);
  FIELD(Optional<Data>, queryHash);
  FIELD(Optional<Int>, testDropPoint);
  FIELD(Optional<Bool>, userPlusOne);
  FIELD(Optional<Bool>, isInitiatorKey);
  /// Media relays: who asks for which session, and why.
  FIELD(Optional<Int>, hoplineUserType);
  FIELD(Optional<Int>, errorCode);
  FIELD(Optional<Bool>, messageCheckpoint);
  FIELD(Optional<Int>, conversationId);
  FIELD(Optional<Int>, protocolVersion);
  FIELD(Optional<String>, applicationId);
  FIELD(Optional<Int>, reason);
  /// The relay that was used before, and the one in use.
  FIELD(Optional<Int>, prevErrorCode);
  FIELD(Optional<Data>, prevAccessToken);
  FIELD(Optional<Data>, prevRelayIp);
  FIELD(Optional<Int>, prevTimestamp);
  FIELD(Optional<Data>, activeAccessToken);
  FIELD(Optional<Data>, activeRelayIp);
  FIELD(Optional<Int>, selfAllocTokenCountOld);
  FIELD(Optional<Int>, selfAllocTokenCount);
  /// Plugins: those asked for together, and independently of them one by itself.
  FIELD(Array<PulseHoplinePluginRequest>, pluginRequests);
  FIELD(Optional<String>, pluginName);
  FIELD(Optional<String>, pluginConfig);
  FIELD(Optional<Int>, pluginStream);
  FIELD(Optional<Bool>, pluginDevMode);
  /// The relay session that is asked for.
  FIELD(Optional<Bool>, hlNewSession);
  FIELD(Optional<Int>, requestType);
  FIELD(Optional<Data>, vespSessionId);
  FIELD(Optional<Int>, relayProvider);
  FIELD(Optional<Bool>, sharedSession);
  FIELD(Optional<String>, groupId);
  FIELD(Optional<Int>, groupMemberCount);
  FIELD(Optional<Int>, allocateInfoAttribute);
  /// The relay that was given. Addresses are 4 or 16 octets as the sender has them.
  FIELD(Optional<Data>, relayIp);
  FIELD(Optional<Data>, relayIpv6);
  FIELD(Optional<Int>, relayPort);
  FIELD(Optional<Data>, relayAccessToken);
  FIELD(Optional<Data>, relaySessionKey);
  FIELD(Optional<Data>, relaySessionId);
  /// Times are in milliseconds, as the sender counts them.
  FIELD(Optional<Int64>, expiryEpochTimeMillis);
  FIELD(Optional<Data>, initiatorIp);
  FIELD(Optional<UInt64>, participantId);
  /// What the relay is and how it is reached.
  FIELD(Optional<Data>, softwareVersion);
  FIELD(Optional<String>, relayBuildVersion);
  FIELD(Optional<Int>, relayHighPriorityPort);
  FIELD(Optional<Int>, ipFamilyPreference);
  FIELD(Optional<Int64>, allocationEpochTimeMillis);
  /// What became of the allocation, for one participant and for each.
  FIELD(Optional<Int>, allocationStatus);
  FIELD(Array<PulseHoplineAllocationStatus>, allocationStatuses);
  FIELD(Array<PulseHoplineSelfAllocToken>, selfAllocTokenList);
  FIELD(Optional<Data>, relayReportingBlob);
  FIELD(Optional<Int>, relayServerType);
  FIELD(Array<PulseHoplinePluginAllocation>, pluginAllocations);
  /// What an answer says of the command that it answers.
  FIELD(Optional<Int>, hlErrorCode);
  FIELD(Optional<Int>, originalCommand);
  FIELD(Optional<Bool>, isBulkedPayload);
  FIELD(Optional<Bool>, wantsAppAck);
  FIELD(Optional<String>, errorDomain);
  FIELD(Optional<Bool>, expectsPeerResponse);
  FIELD(Optional<Int>, allowGDR);
  FIELD(Optional<Int>, sendMode);
  /// Whom the device knows the sender as, or so the message says: these are claims like all else in
  /// it, and prove nothing.
  FIELD(Optional<Bool>, isTrustedSender);
  FIELD(Optional<Bool>, isUPlusOneKey);

  LABELS(PulseUserPayload);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
