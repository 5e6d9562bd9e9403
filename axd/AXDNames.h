#pragma once

#include <string>

// The vendor-prefixed names that the daemon itself tests or posts.
namespace AXDNames {

// Entitlement of a client allowed to manage plug-ins (remove them, discover everything).
inline const std::string kManagerEntitlement = AXD_VENDOR_PREFIX ".private.annexa.manager";
// Plug-in entitlement: elect the plug-in when its record is first built.
inline const std::string kAutoElectEntitlement = AXD_VENDOR_PREFIX ".developer.auto-elect-plugin";
// Plug-in entitlement: a string naming the plug-in whose annotations this one shares.
inline const std::string kReplacePlugInEntitlement = AXD_VENDOR_PREFIX ".developer.replace-plugin";
// Host entitlement: a match rule that limits the plug-ins the host may use.
inline const std::string kAllowedPlugInsEntitlement =
    AXD_VENDOR_PREFIX ".developer.annexa.allowedplugins";
// Extension points whose plug-ins run under sandbox profiles of their own.
inline const std::string kKeyboardServicePoint = AXD_VENDOR_PREFIX ".keyboard-service";
inline const std::string kNetworkFilterPoint = AXD_VENDOR_PREFIX ".netfence.filter-data";
inline const std::string kGlancePreviewPoint = AXD_VENDOR_PREFIX ".glance.extension.preview";
// The consent service that lets a keyboard with open access reach the network.
inline const std::string kKeyboardNetworkService = AXD_VENDOR_PREFIX ".consent.keyboard-network";
// The key of a busy answer: the bundle identifier of the busy instance.
inline const std::string kBusyBundleIdentifierKey = "ExtensionBundleIdentifier";
// Posted after every change of annotations or holds, so that hosts query again.
inline const std::string kAnnotationChangeNotification =
    AXD_VENDOR_PREFIX ".annexa.annotation-change";

}  // namespace AXDNames
