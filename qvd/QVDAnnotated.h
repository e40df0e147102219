// What the annotation store needs of a plug-in: the key its annotation is
// kept under. Several plug-ins may answer the same key (the versions of one
// plug-in, or a plug-in and the one it replaces) and then share one
// annotation.
//
// Thread safety: implementations answer from any thread.
#pragma once

#include <string>

namespace qvd {

class QVDAnnotated {
 public:
  virtual ~QVDAnnotated() = default;

  // The annotation key; never the plug-in's UUID.
  virtual std::string annotationKey() const = 0;
};

}  // namespace qvd
