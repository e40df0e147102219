// A host that ships a plug-in inside its own application gets that copy,
// not another one installed elsewhere under the same identifier.
//
// Thread safety: a pure function of its arguments.
#pragma once

#include <memory>
#include <vector>

#include "platform/mbx/Connection.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

// Removes from `candidates` every plug-in that shares its identifier with a
// plug-in inside the requesting host's application (one whose containing
// application path is a prefix of the host's executable path), unless it
// lies in the same application under another version. Order is kept. Does
// nothing without a connection or when the host's executable is unknown.
void removeHostRelativeDuplicates(std::vector<std::shared_ptr<QVDPlugIn>>& candidates,
                                  const std::shared_ptr<platform::mbx::Connection>& connection);

}  // namespace qvd
