// The locale: names as configuration writes them, the lookup order of
// string tables, the current locale from locale.conf, change notices, and
// localized strings from bundles.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <thread>

#include "platform/dispatch/SerialQueue.h"
#include "platform/locale/LinuxLocaleService.h"
#include "platform/locale/LocaleName.h"
#include "platform/locale/LocalizedStrings.h"
#include "platform/values/Dictionary.h"
#include "platform/vmap/Writer.h"

namespace platform::locale {
namespace {

using namespace std::chrono_literals;

struct TempDir {
  std::string dir = "/tmp/qv-locale-XXXXXX";
  TempDir() { EXPECT_NE(::mkdtemp(dir.data()), nullptr); }
  ~TempDir() { std::filesystem::remove_all(dir); }
  const std::string& path() const { return dir; }
};

void writeText(const std::string& path, const std::string& text) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path + ".new") << text;
  std::filesystem::rename(path + ".new", path);
}

TEST(LocaleNameTest, NamesConfAndLookupOrder) {
  EXPECT_EQ(normalizeLocaleName("de_DE.UTF-8"), "de_DE");
  EXPECT_EQ(normalizeLocaleName("sr_RS@latin"), "sr_RS");
  EXPECT_EQ(normalizeLocaleName("../etc"), std::nullopt);
  EXPECT_EQ(langFromLocaleConf("LANG=\"fr_FR.UTF-8\"\nLANG='it_IT'"), "it_IT") << "later lines win";
  EXPECT_EQ(lookupOrder("de_CH"), (std::vector<std::string>{"de_CH", "de", "en"}));
  EXPECT_EQ(lookupOrder("en"), (std::vector<std::string>{"en"}));
}

TEST(LinuxLocaleServiceTest, ObserversHearEachRealChangeInOrder) {
  TempDir dir;
  const std::string conf = dir.path() + "/locale.conf";
  writeText(conf, "LANG=en_US.UTF-8\n");
  LinuxLocaleService service(dir.path(), std::nullopt);
  std::mutex mu;
  std::vector<std::string> heard;
  auto handle = service.observeChanges(dispatch::SerialQueue::create("test.locale"),
                                       [&](const std::string& locale) {
                                         std::lock_guard<std::mutex> lock(mu);
                                         heard.push_back(locale);
                                       });
  ASSERT_TRUE(handle.ok()) << handle.error().description();
  auto heardCount = [&] {
    std::lock_guard<std::mutex> lock(mu);
    return heard.size();
  };
  auto waitFor = [&](std::size_t n) {
    for (int i = 0; i < 1000 && heardCount() < n; ++i) std::this_thread::sleep_for(5ms);
    return heardCount() == n;
  };
  writeText(conf, "LANG=de_DE.UTF-8\n");
  ASSERT_TRUE(waitFor(1));
  writeText(conf, "# same locale, other text\nLANG=de_DE\n");
  writeText(conf, "LANG=ja_JP\n");
  ASSERT_TRUE(waitFor(2));
  std::filesystem::remove(conf);
  ASSERT_TRUE(waitFor(3));
  {
    std::lock_guard<std::mutex> lock(mu);
    EXPECT_EQ(heard, (std::vector<std::string>{"de_DE", "ja_JP", "en"}));
  }
  handle->cancel();
  writeText(conf, "LANG=ko_KR\n");
  std::this_thread::sleep_for(100ms);
  EXPECT_EQ(heardCount(), 3u) << "nothing after cancel";
  EXPECT_FALSE(LinuxLocaleService(dir.path() + "/missing", std::nullopt)
                   .observeChanges(dispatch::SerialQueue::create("t"), [](const std::string&) {})
                   .ok());
}

TEST(LocalizedStringsTest, MostSpecificTableWinsAndBrokenTablesAreErrors) {
  TempDir bundle;
  writeText(bundle.path() + "/locale/en/Localizable.vmap",
            vmap::write(Value(Dictionary{{"Name", "World Clock"}, {"Count", 3}}), vmap::Format::Xml)
                .value());
  writeText(bundle.path() + "/locale/de/Localizable.vmap",
            vmap::write(Value(Dictionary{{"Name", "Weltuhr"}}), vmap::Format::Xml).value());
  EXPECT_EQ(localizedString(bundle.path(), "Localizable", "Name", "de_AT"), "Weltuhr");
  EXPECT_EQ(localizedString(bundle.path(), "Localizable", "Count", "en"), std::nullopt) << "not text";
  EXPECT_EQ(localizedString(bundle.path(), "../locale/de/Localizable", "Name", "de"), std::nullopt);
  writeText(bundle.path() + "/locale/it/Localizable.vmap", "not a document");
  EXPECT_FALSE(localizedTable(bundle.path(), "Localizable", "it").ok());
  EXPECT_EQ(localizedString(bundle.path(), "Localizable", "Name", "it"), "World Clock")
      << "strings fall back past a broken table";
}

}  // namespace
}  // namespace platform::locale
