// The daemon's static tracing probes (provider "qvd").
//
// Thread safety: every function may be called from any thread.
//
// Probes whose argument is a description text take a callable that builds
// it; the callable runs only while a tracer has the probe enabled, so an
// untraced daemon never pays for the text.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

namespace qvd::probes {

enum class Probe {
  ClientNew,
  ClientDone,
  RequestInput,
  Request,
  RequestOutput,
  DbLoad,
  DiscoverRaw,
  PluginAdd,
  PluginReady,
  PluginRemove,
};
inline constexpr int kProbeCount = 10;

// The probe's name as tracing tools see it ("request-output").
const char* probeName(Probe probe);
bool isEnabled(Probe probe);
// Arms or disarms the probe's is-enabled semaphore as a tracer would.
void setEnabledForTesting(Probe probe, bool enabled);

void clientNew(int pid);
void clientDone(int pid);
void request(int pid, const std::string& name);
void dbLoad(const std::string& errorDomain, std::uint64_t errorCode);
void discoverRaw(unsigned int count);
void pluginAdd(const std::string& path);
void pluginReady(const std::string& uuidText);
void pluginRemove(const std::string& path, bool resolved);

namespace internal {
void fireRequestInput(int pid, const char* description);
void fireRequestOutput(int pid, const char* description);
}  // namespace internal

// REQUIRES: describe() returns something convertible to std::string.
template <typename Describe>
void requestInput(int pid, Describe&& describe) {
  if (!isEnabled(Probe::RequestInput)) return;
  std::string text = std::forward<Describe>(describe)();
  internal::fireRequestInput(pid, text.c_str());
}

template <typename Describe>
void requestOutput(int pid, Describe&& describe) {
  if (!isEnabled(Probe::RequestOutput)) return;
  std::string text = std::forward<Describe>(describe)();
  internal::fireRequestOutput(pid, text.c_str());
}

}  // namespace qvd::probes
