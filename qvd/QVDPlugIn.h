// A plug-in as the daemon knows it. For now it carries only what request
// dispatch needs to resolve and name a plug-in: its UUID and its bundle's
// path. The registry-backed record, with the manifest and everything derived
// from it, replaces these fields when the registry lands.
//
// Thread safety: immutable after creation.
#pragma once

#include <memory>
#include <string>

#include "platform/values/Uuid.h"

namespace qvd {

class QVDPlugIn {
 public:
  QVDPlugIn(platform::Uuid uuid, std::string path) : uuid_(uuid), path_(std::move(path)) {}

  const platform::Uuid& uuid() const { return uuid_; }
  // Canonical absolute path of the plug-in's bundle.
  const std::string& path() const { return path_; }

  std::string description() const { return "<QVDPlugIn " + uuid_.toString() + " " + path_ + ">"; }

 private:
  const platform::Uuid uuid_;
  const std::string path_;
};

}  // namespace qvd
