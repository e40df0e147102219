// The SQLite layer under the registry: a transaction that is not committed
// leaves nothing behind, and damage is told apart from other failures.
#include <gtest/gtest.h>

#include "platform/holvane/RegistryError.h"
#include "platform/holvane/internal/Sqlite.h"
#include "tests/unit/holvane/HolvaneTestSupport.h"

namespace platform::holvane::internal {
namespace {

using testing::SystemRoot;
using testing::writeText;

std::int64_t rowCount(Database& db) {
  Result<Statement> count = db.prepare("SELECT count(*) FROM t");
  EXPECT_TRUE(count.ok());
  if (!count.ok() || !count->step().ok()) return -1;
  return count->columnInt(0);
}

Status insert(Database& db, std::int64_t value) {
  Result<Statement> statement = db.prepare("INSERT INTO t(v) VALUES(?1)");
  if (!statement.ok()) return statement.error();
  if (Status bound = statement->bindInt(1, value); !bound.ok()) return bound;
  return statement->run();
}

TEST(StorageTest, OnlyCommittedTransactionsLast) {
  SystemRoot root;
  Result<std::unique_ptr<Database>> db = Database::open(root / "t.sqlite");
  ASSERT_TRUE(db.ok());
  ASSERT_TRUE((*db)->exec("CREATE TABLE t(v INTEGER UNIQUE)").ok());
  {
    Result<Transaction> abandoned = Transaction::begin(**db);
    ASSERT_TRUE(abandoned.ok());
    ASSERT_TRUE(insert(**db, 1).ok());
  }
  EXPECT_EQ(rowCount(**db), 0);
  {
    Result<Transaction> kept = Transaction::begin(**db);
    ASSERT_TRUE(kept.ok());
    ASSERT_TRUE(insert(**db, 2).ok());
    // A failing statement inside does not undo what came before it...
    Status duplicate = insert(**db, 2);
    ASSERT_FALSE(duplicate.ok());
    EXPECT_TRUE(isRegistryError(duplicate.error(), RegistryErrorCode::Storage));
    ASSERT_TRUE(kept->commit().ok());
  }
  EXPECT_EQ(rowCount(**db), 1);
  // ...and the file reads back after reopening.
  db = Database::open(root / "t.sqlite");
  ASSERT_TRUE(db.ok());
  EXPECT_EQ(rowCount(**db), 1);
}

// Statements are reused: a reused one starts with no bindings and from its
// first row, a text prepared again while its statement is still stepping
// gets a statement of its own, and a reused statement sees a changed table.
TEST(StorageTest, ReusedStatementsStartAfresh) {
  SystemRoot root;
  Result<std::unique_ptr<Database>> db = Database::open(root / "s.sqlite");
  ASSERT_TRUE(db.ok());
  Database& d = **db;
  ASSERT_TRUE(d.exec("CREATE TABLE t(v INTEGER UNIQUE)").ok());
  for (int v : {1, 2, 3}) ASSERT_TRUE(insert(d, v).ok());
  constexpr std::string_view kAbove = "SELECT v FROM t WHERE v > ?1 ORDER BY v";
  {
    Result<Statement> outer = d.prepare(kAbove);
    ASSERT_TRUE(outer.ok());
    ASSERT_TRUE(outer->bindInt(1, 1).ok());
    ASSERT_EQ(*outer->step(), StepResult::Row);
    EXPECT_EQ(outer->columnInt(0), 2);
    // The same text while `outer` is mid-way through its rows.
    Result<Statement> inner = d.prepare(kAbove);
    ASSERT_TRUE(inner.ok());
    ASSERT_TRUE(inner->bindInt(1, 2).ok());
    ASSERT_EQ(*inner->step(), StepResult::Row);
    EXPECT_EQ(inner->columnInt(0), 3);
    ASSERT_EQ(*outer->step(), StepResult::Row);
    EXPECT_EQ(outer->columnInt(0), 3);
  }
  // Unbound now: NULL compares as nothing, so no rows.
  Result<Statement> unbound = d.prepare(kAbove);
  ASSERT_TRUE(unbound.ok());
  EXPECT_EQ(*unbound->step(), StepResult::Done);
  ASSERT_TRUE(d.exec("DROP TABLE t; CREATE TABLE t(v TEXT); INSERT INTO t VALUES('x')").ok());
  EXPECT_EQ(rowCount(d), 1);
  Result<Statement> again = d.prepare("SELECT v FROM t");
  ASSERT_TRUE(again.ok());
  ASSERT_EQ(*again->step(), StepResult::Row);
  EXPECT_EQ(again->columnText(0), "x");
}

TEST(StorageTest, GarbageFileIsReportedAsCorrupt) {
  SystemRoot root;
  writeText(root / "bad.sqlite", std::string(2048, 'x'));
  Result<std::unique_ptr<Database>> db = Database::open(root / "bad.sqlite");
  ASSERT_TRUE(db.ok());  // SQLite reads nothing until asked
  Status used = (*db)->exec("CREATE TABLE IF NOT EXISTS t(v)");
  ASSERT_FALSE(used.ok());
  EXPECT_TRUE(isRegistryError(used.error(), RegistryErrorCode::Corrupt)) << used.error().description();
}

}  // namespace
}  // namespace platform::holvane::internal
