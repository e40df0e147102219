// Shared pieces of bench_suite: helper processes (this same binary started
// in another mode, or a program such as dbus-daemon), CPU pinning of whole
// processes, /proc readings, percentiles, the requests as a host sends them
// through QVDaemonClient, and the result table.
//
// Thread safety: plain functions; a Helper and the Table have one owner.
// The request functions may run on several threads at once, each with its
// own client.
#pragma once

#include <sched.h>
#include <sys/types.h>

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "Quorvex/QVDaemonClient.h"
#include "platform/values/Result.h"
#include "platform/values/Uuid.h"
#include "platform/values/Value.h"

namespace bench::suite {

// ---- Samples ---------------------------------------------------------------

// The sample at fraction `p` (0.5 median, 0.99 p99) of the sorted samples.
double percentile(std::vector<double> samples, double p);
// "41.2 µs", "3.21 ms" or "1.80 s", whichever reads best.
std::string duration(double seconds);
// "1,234".
std::string grouped(double n);

// ---- Processes -------------------------------------------------------------

// A child process whose standard output this process reads line by line.
// Destroying it sends SIGTERM and waits for the child.
class Helper {
 public:
  // Starts `argv` (argv[0] is the program path; searched on PATH when it
  // has no slash) with this process's environment. Its standard error goes
  // to `errorPath` when one is given, else to this process's.
  static platform::Result<std::unique_ptr<Helper>> start(const std::vector<std::string>& argv,
                                                         const std::string& errorPath = {});
  ~Helper();
  Helper(const Helper&) = delete;
  Helper& operator=(const Helper&) = delete;

  pid_t pid() const { return pid_; }
  // The next line of the child's output without its newline; none when the
  // child closed its output or said nothing for `timeoutSeconds`.
  std::optional<std::string> readLine(double timeoutSeconds);

 private:
  Helper(pid_t pid, int out) : pid_(pid), out_(out) {}
  pid_t pid_;
  int out_;
  std::string pending_;
};

// This program's own path, for starting it as a helper.
std::string selfPath();

// The first CPU this process may use, and every CPU it may use.
cpu_set_t firstCpu();
cpu_set_t allowedCpus();
// Sets the affinity of every thread of `pid` (0: this process). Threads it
// starts later inherit it from the thread that starts them.
void setProcessAffinity(pid_t pid, const cpu_set_t& cpus);

// VmRSS of `pid`, in bytes; -1 when unknown.
long residentBytes(pid_t pid);
// User plus system CPU time `pid` has used so far, in seconds.
double cpuSeconds(pid_t pid);
// Open descriptors of `pid`.
long openDescriptors(pid_t pid);

// ---- Requests through QVDaemonClient --------------------------------------

// "find" by UUID: true when the daemon answered with a form.
bool findByUuid(QVDaemonClient& client, const platform::Uuid& uuid,
                platform::Value* replyOut = nullptr);
// "find" by the bundle's file URL.
// The same find sent synchronously (QVDaemonClient::sendSynchronously):
// the calling thread reads the reply itself, as a host that waits would.
bool findByUuidSynchronously(QVDaemonClient& client, const platform::Uuid& uuid);
bool findByPath(QVDaemonClient& client, const std::string& bundlePath,
                platform::Value* replyOut = nullptr);
// "match": the number of forms; -2 when the daemon refused because the
// reply would not fit in one message; -1 on any other failure. `uuidsOut`,
// when given, receives every form's UUID.
long match(QVDaemonClient& client, const platform::Dictionary& rules,
           std::vector<platform::Uuid>* uuidsOut = nullptr);
// "annotate" of one plug-in: true on success.
bool annotate(QVDaemonClient& client, const platform::Uuid& uuid,
              const platform::Dictionary& annotations);

// ---- The table -------------------------------------------------------------

// One markdown table: headings for each group, then rows of a figure, what
// it is set against, the target and whether it was met.
class Table {
 public:
  // Rows added from now on go to group `section`; the groups are printed in
  // the order of their numbers, whatever order they were measured in.
  void at(int section) { section_ = section; }
  void heading(std::string title);
  void row(std::string what, std::string figure, std::string against = {}, std::string target = {},
           std::string verdict = {});
  // "met" / "missed", counted for the summary line.
  std::string verdict(bool met);
  std::string markdown() const;
  int missed() const { return missed_; }
  int met() const { return met_; }

 private:
  struct Row {
    std::string cells[5];
    bool heading;
    int section;
  };
  std::vector<Row> rows_;
  int section_ = 0;
  int met_ = 0;
  int missed_ = 0;
};

}  // namespace bench::suite
