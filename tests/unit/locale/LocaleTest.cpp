// The locale: names as configuration writes them, the lookup order of
// string tables, the current locale from locale.conf with its fallbacks,
// change notices, and localized strings from bundles.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <atomic>
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

class TempDir {
 public:
  TempDir() {
    char pattern[] = "/tmp/qv-locale-XXXXXX";
    path_ = ::mkdtemp(pattern);
  }
  ~TempDir() { std::filesystem::remove_all(path_); }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

void writeText(const std::string& path, const std::string& text) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  // Written aside and renamed, as tools replace configuration files.
  std::ofstream(path + ".new") << text;
  std::filesystem::rename(path + ".new", path);
}

TEST(LocaleNameTest, NamesConfAndLookupOrder) {
  const std::vector<std::pair<std::string, std::optional<std::string>>> names = {
      {"de_DE.UTF-8", "de_DE"}, {"fr@euro", "fr"},   {" en_GB ", "en_GB"}, {"sr_RS@latin", "sr_RS"},
      {"C", std::nullopt},      {"POSIX.UTF-8", std::nullopt},            {"", std::nullopt},
      {"../etc", std::nullopt}, {"de DE", std::nullopt}, {std::string(65, 'a'), std::nullopt},
  };
  for (const auto& [text, expected] : names) EXPECT_EQ(normalizeLocaleName(text), expected) << text;

  EXPECT_EQ(langFromLocaleConf("# system locale\nLC_TIME=C\nLANG=de_CH.UTF-8\n"), "de_CH.UTF-8");
  EXPECT_EQ(langFromLocaleConf("LANG=\"fr_FR.UTF-8\"\nLANG='it_IT'"), "it_IT") << "later lines win";
  EXPECT_EQ(langFromLocaleConf("LC_ALL=de\n  \n"), std::nullopt);

  EXPECT_EQ(lookupOrder("de_CH"), (std::vector<std::string>{"de_CH", "de", "en"}));
  EXPECT_EQ(lookupOrder("de"), (std::vector<std::string>{"de", "en"}));
  EXPECT_EQ(lookupOrder("en_US"), (std::vector<std::string>{"en_US", "en"}));
  EXPECT_EQ(lookupOrder("en"), (std::vector<std::string>{"en"}));
}

TEST(LinuxLocaleServiceTest, ConfWinsThenProcessLangThenEnglish) {
  TempDir dir;
  const std::string conf = dir.path() + "/locale.conf";
  LinuxLocaleService withLang(dir.path(), "fr_FR.UTF-8");
  LinuxLocaleService withoutLang(dir.path(), std::nullopt);
  EXPECT_EQ(withLang.currentLocale(), "fr_FR");
  EXPECT_EQ(withoutLang.currentLocale(), "en");
  writeText(conf, "LANG=de_DE.UTF-8\n");
  EXPECT_EQ(withLang.currentLocale(), "de_DE");
  writeText(conf, "LANG=C\n");
  EXPECT_EQ(withLang.currentLocale(), "fr_FR") << "an unusable LANG counts as none";
  writeText(conf, "LANG=de\n" + std::string(LinuxLocaleService::kMaxConfigBytes, '#'));
  EXPECT_EQ(withoutLang.currentLocale(), "en") << "an oversized file is no locale.conf";
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
    const auto deadline = std::chrono::steady_clock::now() + 5s;
    while (heardCount() < n && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(5ms);
    }
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
  auto table = [&](const std::string& language, const Dictionary& strings) {
    const std::string path = bundle.path() + "/locale/" + language + "/Localizable.vmap";
    writeText(path, vmap::write(Value(strings), vmap::Format::Xml).value());
  };
  table("en", Dictionary{{"Name", "World Clock"}, {"Share", "Share"}, {"Count", 3}});
  table("de", Dictionary{{"Name", "Weltuhr"}});
  table("de_CH", Dictionary{{"Share", "Teile"}});

  struct Case {
    std::string locale;
    std::string key;
    std::optional<std::string> text;
  };
  const std::vector<Case> cases = {
      {"de_CH", "Share", "Teile"}, {"de_CH", "Name", "Weltuhr"}, {"de_AT", "Name", "Weltuhr"},
      {"fr", "Name", "World Clock"}, {"de", "Missing", std::nullopt},
      {"en", "Count", std::nullopt},  // not text
  };
  for (const Case& c : cases) {
    EXPECT_EQ(localizedString(bundle.path(), "Localizable", c.key, c.locale), c.text)
        << c.locale << " " << c.key;
  }
  EXPECT_EQ(localizedString(bundle.path(), "Other", "Name", "de"), std::nullopt);
  EXPECT_EQ(localizedString(bundle.path(), "../locale/de/Localizable", "Name", "de"), std::nullopt);

  auto found = localizedTable(bundle.path(), "Localizable", "de_CH");
  ASSERT_TRUE(found.ok());
  ASSERT_TRUE(found->has_value());
  EXPECT_EQ((*found)->get("Share"), Value("Teile"));
  EXPECT_TRUE(localizedTable(bundle.path(), "Nothing", "de").ok());

  writeText(bundle.path() + "/locale/it/Localizable.vmap", "not a document");
  EXPECT_FALSE(localizedTable(bundle.path(), "Localizable", "it").ok());
  EXPECT_EQ(localizedString(bundle.path(), "Localizable", "Name", "it"), "World Clock")
      << "strings fall back past a broken table";
}

}  // namespace
}  // namespace platform::locale
