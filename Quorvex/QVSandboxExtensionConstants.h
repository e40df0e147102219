// Names of the sandbox-extension vocabulary shared by the daemon and its
// clients: the plug-in form keys under which tokens travel to hosts, and the
// class of service-lookup tokens. The texts travel on the wire, so they
// never change.
//
// Thread safety: constants only.
#pragma once

#include <string_view>

// Form key: the map from resource path entries ("." or a relative path) to
// file-extension tokens.
inline constexpr std::string_view QVExtensionsFormKey = "extensions";
// Form key: the token that lets a host look up the plug-in's service.
inline constexpr std::string_view QVServiceExtensionFormKey = "service-extension";
// The extension class under which service-lookup tokens are issued.
inline constexpr std::string_view QVServiceExtensionClass = "com.corvane.quorvex.plugin-service";
