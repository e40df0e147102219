// Measures "annotate" of one plug-in with 10, 1,000 and 10,000 stored
// annotations, each checked by a find afterwards.
#include <sys/stat.h>

#include <cstdio>
#include <filesystem>
#include <fstream>

#include "Quorvex/QVDConstants.h"
#include "bench/suite/SuiteRun.h"
#include "platform/vmap/Writer.h"

namespace bench::suite {

using platform::Dictionary;
using platform::Value;

bool seedAnnotations(const SyntheticRoot& root, std::size_t count) {
  Dictionary data;
  data.reserve(count);
  for (std::size_t i = 0; i < count; ++i) {
    char identifier[64];
    std::snprintf(identifier, sizeof identifier, "com.corvane.bench.plugin%05zu", i);
    data.set(identifier,
             Dictionary{{"election", 1},
                        {"extension", Dictionary{{"pinned", i % 3 == 0},
                                                 {"lastUsed", static_cast<std::int64_t>(i)}}}});
  }
  const Value file(Dictionary{{"version", 16}, {"data", std::move(data)}});
  auto text = platform::vmap::write(file, platform::vmap::Format::Xml);
  if (!text.ok()) return false;
  std::filesystem::create_directories(root.path() + "/var/db");
  std::ofstream out(root.path() + "/var/db/Quorvex-Annotations", std::ios::trunc);
  out << *text;
  return static_cast<bool>(out);
}

bool Suite::annotations() {
  const SyntheticRoot& root = roots_.at(kLarge);
  const std::string file = root.path() + "/var/db/Quorvex-Annotations";
  table_.at(4);
  table_.heading("4. \"annotate\" of one plug-in (each rewrites and fsyncs the annotation file), "
                 "10,000 plug-ins; 41 requests each");
  for (std::size_t annotated : {std::size_t{10}, std::size_t{1'000}, kLarge}) {
    if (!seedAnnotations(root, annotated)) return false;
    Session session;
    if (!start(root, session)) return false;
    Value found;
    if (!findByPath(*session.client, bundlePath(root, 0), &found)) return false;
    const Dictionary* form = found.dictionary()->get(QVDMatchesKey).dictionary();
    auto uuid = platform::Uuid::parse(form->get("uuid").string() ? *form->get("uuid").string() : "");
    if (!uuid) return false;
    std::vector<double> samples;
    std::int64_t election = 0;
    for (int i = 0; i < kAnnotations; ++i) {
      election = i % 2;
      const Dictionary change{{"election", election}};
      bool ok = false;
      samples.push_back(secondsOf([&] { ok = annotate(*session.client, *uuid, change); }));
      if (!ok) return false;
    }
    // The last change is in the form, and the stored extension entry stayed.
    if (!findByPath(*session.client, bundlePath(root, 0), &found)) return false;
    const Dictionary* annotation =
        found.dictionary()->get(QVDMatchesKey).dictionary()->get("annotations").dictionary();
    if (annotation == nullptr || annotation->get("election").int64() != election ||
        annotation->get("extension").dictionary() == nullptr) {
      progress("the annotation did not land");
      return false;
    }
    struct stat status {};
    ::stat(file.c_str(), &status);
    table_.row(grouped(static_cast<double>(annotated)) + " annotated plug-ins",
               duration(percentile(samples, 0.5)),
               "p99 " + duration(percentile(samples, 0.99)) + "; file of " +
                   grouped(static_cast<double>(status.st_size)) + " bytes");
    progress("annotate with %zu annotated: %.2f ms", annotated, percentile(samples, 0.5) * 1e3);
  }
  return true;
}

}  // namespace bench::suite
