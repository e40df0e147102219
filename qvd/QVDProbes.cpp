#include "qvd/QVDProbes.h"

#include "probes_provider.h"

namespace qvd::probes {
namespace {

// The semaphores are written by tracers through /proc/<pid>/mem; reading them
// through a volatile pointer keeps the compiler from caching the value.
volatile unsigned short* semaphore(Probe probe) {
  switch (probe) {
    case Probe::ClientNew: return &qvd_client__new_semaphore;
    case Probe::ClientDone: return &qvd_client__done_semaphore;
    case Probe::RequestInput: return &qvd_request__input_semaphore;
    case Probe::Request: return &qvd_request_semaphore;
    case Probe::RequestOutput: return &qvd_request__output_semaphore;
    case Probe::DbLoad: return &qvd_db__load_semaphore;
    case Probe::DiscoverRaw: return &qvd_discover__raw_semaphore;
    case Probe::PluginAdd: return &qvd_plugin__add_semaphore;
    case Probe::PluginReady: return &qvd_plugin__ready_semaphore;
    case Probe::PluginRemove: return &qvd_plugin__remove_semaphore;
  }
  return nullptr;
}

}  // namespace

const char* probeName(Probe probe) {
  switch (probe) {
    case Probe::ClientNew: return "client-new";
    case Probe::ClientDone: return "client-done";
    case Probe::RequestInput: return "request-input";
    case Probe::Request: return "request";
    case Probe::RequestOutput: return "request-output";
    case Probe::DbLoad: return "db-load";
    case Probe::DiscoverRaw: return "discover-raw";
    case Probe::PluginAdd: return "plugin-add";
    case Probe::PluginReady: return "plugin-ready";
    case Probe::PluginRemove: return "plugin-remove";
  }
  return "unknown";
}

bool isEnabled(Probe probe) { return *semaphore(probe) != 0; }

void setEnabledForTesting(Probe probe, bool enabled) { *semaphore(probe) = enabled ? 1 : 0; }

// The probe sites carry their arguments unconditionally: firing costs a nop
// when nobody traces, and these values exist anyway.
void clientNew(int pid) { QVD_CLIENT_NEW(pid); }
void clientDone(int pid) { QVD_CLIENT_DONE(pid); }
void request(int pid, const std::string& name) { QVD_REQUEST(pid, const_cast<char*>(name.c_str())); }
void dbLoad(const std::string& errorDomain, std::uint64_t errorCode) {
  QVD_DB_LOAD(const_cast<char*>(errorDomain.c_str()), errorCode);
}
void discoverRaw(unsigned int count) { QVD_DISCOVER_RAW(count); }
void pluginAdd(const std::string& path) { QVD_PLUGIN_ADD(const_cast<char*>(path.c_str())); }
void pluginReady(const std::string& uuidText) {
  QVD_PLUGIN_READY(const_cast<char*>(uuidText.c_str()));
}
void pluginRemove(const std::string& path, bool resolved) {
  QVD_PLUGIN_REMOVE(const_cast<char*>(path.c_str()), resolved);
}

namespace internal {
void fireRequestInput(int pid, const char* description) {
  QVD_REQUEST_INPUT(pid, const_cast<char*>(description));
}
void fireRequestOutput(int pid, const char* description) {
  QVD_REQUEST_OUTPUT(pid, const_cast<char*>(description));
}
}  // namespace internal

}  // namespace qvd::probes
