// The parsers of /proc/<pid>/stat, /proc/<pid>/status and pidfd fdinfo, on
// the inputs a hostile process can shape (its command name) and broken ones.
#include <gtest/gtest.h>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/Pidfd.h"
#include "platform/mbx/identity/internal/ProcStat.h"
#include "platform/mbx/identity/internal/ProcStatus.h"

namespace platform::mbx::internal {
namespace {

// A stat line as the kernel writes it: start time in field 22, every other
// number distinct from it.
std::string statLine(const std::string& name, const std::string& start, int fields = 52) {
  std::string line = "4242 (" + name + ") S";
  for (int field = 4; field <= fields; ++field)
    line += " " + (field == 22 ? start : std::to_string(field * 7));
  return line + "\n";
}

template <typename T>
void expectMalformed(const Result<T>& r, const std::string& input) {
  ASSERT_FALSE(r.ok()) << input;
  EXPECT_TRUE(isIdentityError(r.error(), IdentityErrorCode::MalformedProcFile)) << input;
}

TEST(PeerIdentityProcStatTest, NamesCannotShiftTheFields) {
  for (const std::string name : {"a) b", ") S 1 2 3 4", "x) Z 9 9 (y", "new\nline", ""}) {
    Result<ProcStat> stat = parseProcStat(statLine(name, "987654321"));
    ASSERT_TRUE(stat.ok()) << name << ": " << stat.error().description();
    EXPECT_EQ(stat->pid, 4242) << name;
    EXPECT_EQ(stat->command, name);
    EXPECT_EQ(stat->startTime, 987654321u) << name;
  }
  for (const std::string& line :
       {std::string("77 (qvd"), statLine("qvd", "1", 21), statLine("qvd", "-5"),
        statLine("qvd", "18446744073709551616"), "0" + statLine("qvd", "1").substr(4)})
    expectMalformed(parseProcStat(line), line);
  Result<ProcStat> over = parseProcStat(statLine(std::string(kProcStatLimit, 'n'), "31"));
  ASSERT_FALSE(over.ok());
  EXPECT_TRUE(isIdentityError(over.error(), IdentityErrorCode::TooLong));
}

TEST(PeerIdentityProcStatusTest, ReadsSeccompAndNoNewPrivsOnceEach) {
  Result<ProcStatusFacts> facts =
      parseProcStatus("Name:\tqvd\nNoNewPrivs:\t1\nSeccomp:\t2\nSeccomp_filters:\t1\n");
  ASSERT_TRUE(facts.ok()) << facts.error().description();
  EXPECT_EQ(facts->seccompMode, 2);
  EXPECT_TRUE(facts->noNewPrivs);
  facts = parseProcStatus("Name:\tx\nNoNewPrivs: \t0 \n");  // no seccomp in the kernel
  ASSERT_TRUE(facts.ok()) << facts.error().description();
  EXPECT_EQ(facts->seccompMode, 0);
  for (const std::string text : {"Name:\tx\nSeccomp:\t0\n", "NoNewPrivs:\t0\nNoNewPrivs:\t1\n",
                                 "NoNewPrivs:\t0\nSeccomp:\t3\n", "Name:\tNoNewPrivs:\t0\n"})
    expectMalformed(parseProcStatus(text), text);
}

TEST(PeerIdentityPidfdInfoTest, ReadsThePidLineOnly) {
  const std::string info = "pos:\t0\nflags:\t02000002\n";
  EXPECT_EQ(parsePidfdInfo(info + "Pid:\t4242\nNSpid:\t4242\t1\n").valueOr(0), 4242);
  EXPECT_EQ(parsePidfdInfo(info + "Pid:\t-1\nNSpid:\t-1\n").valueOr(0), -1);  // exited
  for (const std::string& bad : {info, info + "Pid:\t12x\n", info + "Pid:\t1\nPid:\t2\n"})
    expectMalformed(parsePidfdInfo(bad), bad);
}

}  // namespace
}  // namespace platform::mbx::internal
