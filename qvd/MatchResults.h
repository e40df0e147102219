// The results of one "match" request while its exports finish: the kept
// forms, the replacement declarations, and the version-duplicate rule that
// decides which of two forms of one identifier stays. Everything that
// compares plug-ins with each other happens in merge(), on the request's own
// serial post-export queue, so the lists need no lock.
//
// Thread safety: merge() runs on postExportQueue() only; the getters and
// finish() on the request's queue after every export has been waited for.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/cbor/EncodedValue.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/values/Dictionary.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

class Transaction;

class MatchResults {
 public:
  // A kept form; shared so that a replacement declaration keeps pointing at
  // the same form when other forms come and go.
  using Form = std::shared_ptr<platform::Dictionary>;

  // `flags` are the request's discovery flags; `transaction` adds each
  // kept form's annotations.
  MatchResults(std::uint64_t flags, std::shared_ptr<const Transaction> transaction);

  // "com.corvane.qvd.postExporting", made for this request.
  const std::shared_ptr<platform::dispatch::SerialQueue>& postExportQueue() const { return queue_; }

  // Merges the exported `form` of `plugIn`: applies the version-duplicate
  // rule against the forms kept so far, then (when kept) adds the
  // annotations and daemon-side fields, records the plug-in's replacement
  // declarations and encodes the form for the reply, while other forms are
  // still being exported. REQUIRES: on postExportQueue().
  void merge(const QVDPlugIn& plugIn, platform::Dictionary form);

  // Gathers the kept forms, marks replacements ("overrider" on the
  // replaced form, "overriding" on the replacing one) and sorts the forms
  // by identifier, then version, then path, so that the same state always
  // gives the same reply. REQUIRES: every merge has finished.
  void finish();

  // REQUIRES: finish() has run.
  const std::vector<Form>& matches() const { return matches_; }
  // The encodings of matches(), in their order; none when a form cannot be
  // encoded. REQUIRES: finish() has run.
  std::optional<std::vector<platform::cbor::EncodedValue>> encodedMatches() const;

 private:
  enum class Verdict { KeepBoth, DropNew, ReplaceKept };
  // What happens to a new form of `plugIn` given a kept form of the same
  // identifier.
  Verdict compare(const QVDPlugIn& plugIn, const platform::Dictionary& kept) const;
  // Whether `plugIn` wins over a kept form of the same version.
  static bool preferred(const QVDPlugIn& plugIn, const platform::Dictionary& kept);
  void recordReplacements(const QVDPlugIn& plugIn, const Form& form);
  // (Re-)encodes `form`; a failure is logged and leaves no encoding.
  void encode(const Form& form);

  const std::uint64_t flags_;
  const std::shared_ptr<const Transaction> transaction_;
  const std::shared_ptr<platform::dispatch::SerialQueue> queue_;
  // Kept forms by identifier: a merge compares a form with the forms of its
  // own identifier only, so that merging n forms costs n steps, not n^2.
  std::unordered_map<std::string, std::vector<Form>> kept_;
  std::vector<Form> matches_;
  // Replaced identifier -> the form of the plug-in that replaces it.
  std::map<std::string, Form, std::less<>> overrides_;
  // Each kept form's encoding, as it stands.
  std::unordered_map<const platform::Dictionary*, platform::cbor::EncodedValue> encodings_;
};

// The version text a plug-in's form carries: its version, or "<none>".
std::string versionText(const QVDPlugIn& plugIn);

}  // namespace qvd
