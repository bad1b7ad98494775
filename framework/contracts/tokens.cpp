// SPDX-License-Identifier: Apache-2.0
#include "framework/contracts/construct.h"

#include <keelgate/errors.h>
#include <keelgate/records/vesp_invitation.h>

namespace Keelgate {

namespace {

constexpr const char* tokenDomain = "com.tessen.Keelgate.SkyvaultSharingToken";

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
  if (shareURL.empty()) throw Breach(tokenDomain, "Empty share URL");
  return keep(std::move(tokenData));
}

}  // namespace Keelgate
