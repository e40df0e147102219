// Thrown by the client library when the daemon breaks the protocol (an error
// text without a code, a reply that is not a dictionary): the client cannot
// go on believing either the request succeeded or that it failed, so it
// refuses to guess. Callers that talk to untrusted daemons catch it.
//
// Thread safety: an immutable exception object.
#pragma once

#include <stdexcept>
#include <string>

class QVInternalInconsistencyException : public std::logic_error {
 public:
  explicit QVInternalInconsistencyException(const std::string& what) : std::logic_error(what) {}
};
