// The parsers of /proc/<pid>/stat and /proc/<pid>/status, on the inputs a
// hostile process can shape (its command name) and on broken ones.
#include <gtest/gtest.h>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/Pidfd.h"
#include "platform/mbx/identity/internal/ProcStat.h"
#include "platform/mbx/identity/internal/ProcStatus.h"

namespace platform::mbx::internal {
namespace {

// A stat line as the kernel writes it: 52 fields, start time in field 22,
// every other number distinct from it.
std::string statLine(const std::string& pid, const std::string& name, const std::string& start,
                     int fields = 52) {
  std::string line = pid + " (" + name + ") S";
  for (int field = 4; field <= fields; ++field) {
    line += " " + (field == 22 ? start : std::to_string(field * 7));
  }
  return line + "\n";
}

TEST(PeerIdentityProcStatTest, NamesCannotShiftTheFields) {
  for (const std::string name :
       {"qvd", "a b", "a) b", ")", "((", ") S 1 2 3 4", "x) Z 9 9 (y", "new\nline", "", " ) ) "}) {
    Result<ProcStat> stat = parseProcStat(statLine("4242", name, "987654321"));
    ASSERT_TRUE(stat.ok()) << name << ": " << stat.error().description();
    EXPECT_EQ(stat->pid, 4242) << name;
    EXPECT_EQ(stat->command, name);
    EXPECT_EQ(stat->state, 'S') << name;
    EXPECT_EQ(stat->startTime, 987654321u) << name;
  }
  std::string bare = statLine("1", "init", "5");  // without the final newline too
  bare.pop_back();
  EXPECT_EQ(parseProcStat(bare).valueOr(ProcStat{}).startTime, 5u);
}

TEST(PeerIdentityProcStatTest, RefusesMalformedLines) {
  const std::vector<std::string> lines = {
      "",
      "77 qvd S 1 2 3",                               // no parentheses
      "77 (qvd",                                      // unclosed
      statLine("77", "qvd", "1", 21),                 // stops before the start time
      statLine("77", "qvd", "12a"),                   // not a number
      statLine("77", "qvd", "-5"),                    // signed
      statLine("77", "qvd", ""),                      // empty field
      statLine("77", "qvd", "18446744073709551616"),  // past 64 bits
      statLine("0", "qvd", "1"),                      // no process has pid 0
      statLine("x", "qvd", "1"),
      "77 (qvd)S 1",                                                     // no space after the name
      "77 (qvd) SS 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 20",  // state of two letters
  };
  for (const std::string& line : lines) {
    Result<ProcStat> stat = parseProcStat(line);
    ASSERT_FALSE(stat.ok()) << line;
    EXPECT_TRUE(isIdentityError(stat.error(), IdentityErrorCode::MalformedProcFile))
        << line << ": " << stat.error().description();
  }
}

TEST(PeerIdentityProcStatTest, LimitsTheLineLength) {
  const std::size_t frame = statLine("77", "", "31").size();
  const std::string atLimit = statLine("77", std::string(kProcStatLimit - frame, 'n'), "31");
  ASSERT_EQ(atLimit.size(), kProcStatLimit);
  EXPECT_EQ(parseProcStat(atLimit).valueOr(ProcStat{}).startTime, 31u);
  Result<ProcStat> over = parseProcStat(statLine("77", std::string(kProcStatLimit, 'n'), "31"));
  ASSERT_FALSE(over.ok());
  EXPECT_TRUE(isIdentityError(over.error(), IdentityErrorCode::TooLong));
}

constexpr const char* kStatus =
    "Name:\tqvd\nUmask:\t0022\nState:\tS (sleeping)\nTgid:\t99\nPid:\t99\n"
    "CapEff:\t0000000000000000\nNoNewPrivs:\t1\nSeccomp:\t2\nSeccomp_filters:\t1\n"
    "Speculation_Store_Bypass:\tthread vulnerable\nCpus_allowed_list:\t0-1\n";

TEST(PeerIdentityProcStatusTest, ReadsSeccompAndNoNewPrivs) {
  Result<ProcStatusFacts> facts = parseProcStatus(kStatus);
  ASSERT_TRUE(facts.ok()) << facts.error().description();
  EXPECT_EQ(facts->seccompMode, 2);
  EXPECT_TRUE(facts->noNewPrivs);

  // No seccomp in the kernel: no line, no filter. Blanks around values go.
  facts = parseProcStatus("Name:\tx\nNoNewPrivs: \t0 \n");
  ASSERT_TRUE(facts.ok()) << facts.error().description();
  EXPECT_EQ(facts->seccompMode, 0);
  EXPECT_FALSE(facts->noNewPrivs);
}

TEST(PeerIdentityProcStatusTest, RefusesMissingRepeatedOrBadFacts) {
  const std::vector<std::string> texts = {
      "Name:\tx\nSeccomp:\t0\n",                        // no NoNewPrivs
      "NoNewPrivs:\t0\nSeccomp:\t0\nNoNewPrivs:\t1\n",  // given twice
      "NoNewPrivs:\t2\n",
      "NoNewPrivs:\t\n",
      "NoNewPrivs:\t0\nSeccomp:\t3\n",
      "NoNewPrivs:\t0\nSeccomp:\tfilter\n",
      // A key only counts at the start of a line.
      "Name:\tNoNewPrivs:\t0\n",
  };
  for (const std::string& text : texts) {
    Result<ProcStatusFacts> facts = parseProcStatus(text);
    ASSERT_FALSE(facts.ok()) << text;
    EXPECT_TRUE(isIdentityError(facts.error(), IdentityErrorCode::MalformedProcFile)) << text;
  }
  Result<ProcStatusFacts> tooLong =
      parseProcStatus(std::string(kStatus) + std::string(kProcStatusLimit, 'x'));
  ASSERT_FALSE(tooLong.ok());
  EXPECT_TRUE(isIdentityError(tooLong.error(), IdentityErrorCode::TooLong));
}

TEST(PeerIdentityPidfdInfoTest, ReadsThePidLineOnly) {
  const std::string info = "pos:\t0\nflags:\t02000002\nmnt_id:\t15\nino:\t1057\n";
  EXPECT_EQ(parsePidfdInfo(info + "Pid:\t4242\nNSpid:\t4242\t1\n").valueOr(0), 4242);
  EXPECT_EQ(parsePidfdInfo(info + "Pid:\t-1\nNSpid:\t-1\n").valueOr(0), -1);  // exited
  for (const std::string& bad : {info, info + "Pid:\t\n", info + "Pid:\t12x\n",
                                 info + "Pid:\t1\nPid:\t2\n", std::string("NSpid:\t7\n")}) {
    Result<pid_t> pid = parsePidfdInfo(bad);
    ASSERT_FALSE(pid.ok()) << bad;
    EXPECT_TRUE(isIdentityError(pid.error(), IdentityErrorCode::MalformedProcFile)) << bad;
  }
}

}  // namespace
}  // namespace platform::mbx::internal
