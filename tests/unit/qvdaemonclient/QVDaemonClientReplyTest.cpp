// Reading replies without a daemon: errorInReply over the shapes a reply can take.
#include <gtest/gtest.h>

#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVInternalInconsistencyException.h"
#include "platform/mbx/MbxError.h"

namespace {

using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Value;

TEST(QVDaemonClientReplies, ErrorInReplyReadsEveryReplyShape) {
  const Error ipc =
      platform::mbx::makeError(platform::mbx::ErrorCode::ConnectionInvalid, "peer closed");
  struct Case {
    const char* name;
    Result<Value> reply;
    std::optional<std::int64_t> code;  // none: success
    std::string description;
  };
  const Case cases[] = {
      {"the exchange failed", ipc, QVErrorInvalidRequest, ipc.description()},
      {"an error the library made", QVErrorWithCodeMessage(QVErrorBadPath, "not a file URL: x"),
       QVErrorBadPath, "not a file URL: x"},
      {"code 0", Value(Dictionary{{"errorcode", 0}}), std::nullopt, ""},
      {"code without text", Value(Dictionary{{"errorcode", 9}}), QVErrorBadPath,
       "unknown error returned by Quorvex subsystem"},
      {"a code the library does not know", Value(Dictionary{{"errorcode", 99}, {"error", "new"}}),
       99, "new"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::optional<Error> error = QVDaemonClient::errorInReply(c.reply);
    ASSERT_EQ(error.has_value(), c.code.has_value());
    if (!error) continue;
    EXPECT_EQ(error->domain(), "Quorvex");
    EXPECT_EQ(error->code(), *c.code);
    EXPECT_EQ(error->description(), c.description);
  }
}

TEST(QVDaemonClientReplies, ABrokenProtocolThrowsWithWhatWasWrong) {
  const std::pair<Value, const char*> cases[] = {
      {Dictionary{{"errorcode", 0}, {"error", "x"}}, "qvd reported error without a code: x"},
      {Value("not a dictionary"),
       "qvd replied with something other than a dictionary: not a dictionary"},
      {Dictionary{{"errorcode", -1}}, "qvd reported an error code that is not one: -1"},
      {Dictionary{{"errorcode", 9}, {"error", 5}}, "qvd reported an error that is not text: 5"},
  };
  for (const auto& [body, message] : cases) {
    SCOPED_TRACE(message);
    try {
      (void)QVDaemonClient::errorInReply(body);
      ADD_FAILURE() << "no exception";
    } catch (const QVInternalInconsistencyException& e) {
      EXPECT_STREQ(e.what(), message);
    }
  }
}

}  // namespace
