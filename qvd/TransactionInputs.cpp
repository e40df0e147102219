// The inputs that several requests share: the "paths" list, resolved on the
// daemon's file system, and the "uuids" list, resolved to plug-ins.
#include <limits.h>
#include <stdlib.h>

#include <memory>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"
#include "qvd/WireValues.h"

namespace qvd {

bool Transaction::marshalPaths(const PathCallback& callback) {
  const platform::Array* paths = request_.get(QVDPathsKey).array();
  if (paths == nullptr) {
    failMessage(QVErrorInvalidRequest, "invalid request format");
    return false;
  }
  for (const platform::Value& element : *paths) {
    const std::string* text = wire::text(element);
    if (text == nullptr) {
      failMessage(QVErrorInvalidRequest, "invalid request format");
      return false;
    }
    if (text->empty() || text->front() != '/') {
      failMessage(QVErrorBadPath, "absolute path required: " + *text);
      return false;
    }
    // A path the file system cannot resolve (it does not exist yet, or is
    // gone) is handed on as given; the handler decides whether that is an
    // error.
    char resolved[PATH_MAX];
    bool keepGoing;
    if (text->find('\0') == std::string::npos && ::realpath(text->c_str(), resolved) != nullptr) {
      keepGoing = callback(std::string(resolved), PathResolution::Resolved);
    } else {
      keepGoing = callback(*text, PathResolution::Unresolved);
    }
    if (!keepGoing) return false;
  }
  return true;
}

bool Transaction::processPaths(const PathCallback& callback) {
  const bool passed = marshalPaths(callback);
  if (passed) done();
  return passed;
}

bool Transaction::processUuidList(const PlugInCallback& callback) {
  const platform::Array* uuids = request_.get(QVDUUIDKey).array();
  if (uuids == nullptr) {
    failMessage(QVErrorInvalidRequest, "invalid request format (uuid)");
    return false;
  }
  const platform::Value& pathsValue = request_.get(QVDPathsKey);
  const platform::Array* paths = nullptr;
  if (!pathsValue.isNone()) {
    paths = pathsValue.array();
    if (paths == nullptr) {
      QVLogTraffic().notice("Paths present but not an array (ignoring values)");
    } else if (paths->size() != uuids->size()) {
      QVLogTraffic().notice("Paths present but has different count than UUIDs (ignoring)");
      paths = nullptr;
    }
  }
  for (std::size_t i = 0; i < uuids->size(); ++i) {
    std::optional<platform::Uuid> uuid = (*uuids)[i].uuid();
    if (!uuid) {
      failMessage(QVErrorInvalidRequest, "invalid request (bad uuid array)");
      return false;
    }
    std::shared_ptr<const QVDPlugIn> plugIn = server()->findPlugIn(*uuid);
    if (!plugIn && paths != nullptr) {
      QVLogTraffic().info("Failed to find plugin by %{uuid_t}.16P", *uuid);
      if (const std::string* path = wire::text((*paths)[i])) {
        QVLogTraffic().info("Looking for plugin %{uuid_t}.16P by path %s", *uuid, *path);
        if (!path->empty() && path->front() == '/') {
          plugIn = server()->findPlugInAtPath(QVFileURLFromPath(*path));
        }
      }
    }
    if (!plugIn) {
      failMessage(QVErrorInvalidRequest, "no such plugin (uuid not found)");
      return false;
    }
    if (!callback(plugIn)) return false;
  }
  return true;
}

}  // namespace qvd
