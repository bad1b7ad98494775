// SPDX-License-Identifier: Apache-2.0
#include "framework/contracts/construct.h"

#include <keelgate/errors.h>
#include <keelgate/records/vesp_invitation.h>

namespace Keelgate {

namespace {

constexpr const char* tokenDomain = "com.tessen.Keelgate.SkyvaultSharingToken";

/// Octets are kept and not parsed: a parser for a format that only the cloud needs would be one
/// more thing to attack.
SkyvaultSharingToken keep(Data tokenData) {
  if (tokenData.empty()) throw Breach(tokenDomain, "Empty sharing token");
  return construct<SkyvaultSharingToken>({.tokenData = std::move(tokenData)});
}

}  // namespace

SkyvaultSharingToken VespHearthInvitation::decodeSkyvaultToken(Data tokenData) {
  return keep(std::move(tokenData));
}

SkyvaultSharingToken VespCofferSharingInvitation::decodeSkyvaultToken(Data tokenData,
                                                                      const String& shareURL) {
  // Before the octets are looked at: of two faults this one is reported.
  if (shareURL.empty()) throw Breach(tokenDomain, "Empty share URL");
  return keep(std::move(tokenData));
}

}  // namespace Keelgate
