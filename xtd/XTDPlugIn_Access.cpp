// Which hosts may use the plug-in.
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

std::optional<std::string> XTDPlugIn::allowForClient(XTDIpcClient& client) const {
  return allowForClient(client, client.entitlementValueForKey(std::string(XTAllowedPlugInsEntitlement)));
}

std::optional<std::string> XTDPlugIn::allowForClient(XTDIpcClient& client, const Value& restriction) const {
  if (restriction && !restriction.isDictionary()) return "invalid host restriction entitlement";
  if (!match(restriction)) return "the host's plug-in entitlement does not allow this plug-in";
  const Value required = pluginKey(XTHostEntitlementInfoKey);
  const bool held = required.isString() && client.hasEntitlement(required.string());
  if (required && !held) return fmt::format("the host does not have the \"{}\" entitlement", required);
  return std::nullopt;
}

}  // namespace extora
