#include "qvd/Transaction.h"

#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDProbes.h"
#include "qvd/QVDServer.h"
#include "qvd/WireValues.h"

namespace qvd {

namespace {

// The request table: names in the order they are compared, and the handler
// each one runs.
struct Route {
  std::string_view name;
  void (Transaction::*handler)();
};

constexpr Route kRoutes[] = {
    {QVDAddRequest, &Transaction::addPlugIns},
    {QVDRemoveRequest, &Transaction::removePlugIns},
    {QVDBulkRequest, &Transaction::bulkPlugIns},
    {QVDMatchRequest, &Transaction::matchPlugIns},
    {QVDReadyRequest, &Transaction::readyPlugIns},
    {QVDAccessRequest, &Transaction::accessPlugIns},
    {QVDAnnotateRequest, &Transaction::annotatePlugIns},
    {QVDBulkAnnotateRequest, &Transaction::bulkAnnotatePlugIns},
    {QVDLockdownRequest, &Transaction::lockDownPlugIns},
    {QVDFindRequest, &Transaction::findPlugIn},
};

std::mutex gTestRoutesMu;
std::vector<std::pair<std::string, std::function<void(Transaction&)>>> gTestRoutes;

std::function<void(Transaction&)> testRoute(const std::string& name) {
  std::lock_guard<std::mutex> lock(gTestRoutesMu);
  for (const auto& [routeName, handler] : gTestRoutes) {
    if (routeName == name) return handler;
  }
  return nullptr;
}

}  // namespace

void Transaction::addRequestForTesting(std::string name,
                                       std::function<void(Transaction&)> handler) {
  std::lock_guard<std::mutex> lock(gTestRoutesMu);
  gTestRoutes.emplace_back(std::move(name), std::move(handler));
}

void Transaction::removeRequestsForTesting() {
  std::lock_guard<std::mutex> lock(gTestRoutesMu);
  gTestRoutes.clear();
}

Transaction::Transaction(const platform::mbx::Message& request,
                         std::shared_ptr<QVDMbxClient> client)
    : client_(std::move(client)),
      request_(*request.dictionary()),
      reply_(platform::mbx::Reply::createReply(request)) {}

std::shared_ptr<Transaction> Transaction::initWithRequestForClient(
    const platform::mbx::Message& request, std::shared_ptr<QVDMbxClient> client) {
  return std::shared_ptr<Transaction>(new Transaction(request, std::move(client)));
}

const std::shared_ptr<QVDServer>& Transaction::server() const { return client_->server(); }

std::shared_ptr<platform::mbx::Connection> Transaction::connection() const {
  return client_->connection();
}

void Transaction::dispatch() {
  QV_ASSERT_ON_QUEUE(server()->mainQueue());
  const std::string* name = wire::text(request_.get(QVDRequestKey));
  const std::uint64_t version = wire::uint64(request_.get(QVDVersionKey)).value_or(0);
  version_.store(version);
  // Answered even for a client that is going away: a sender of the wrong
  // version learns why before anything else.
  if (version != QVDProtocolVersion && version != QVDPreviousProtocolVersion) {
    failMessage(QVErrorVersionMismatch, "unsupported protocol version " + std::to_string(version) +
                                            " (current " + std::to_string(QVDProtocolVersion) +
                                            ")");
    return;
  }
  if (!client_->acceptWork()) return;
  const std::string shownName = name ? *name : std::string("(none)");
  QVLogOps().debug("client %d requested %{public}s", client_->pid(), shownName);
  probes::request(client_->pid(), shownName);
  if (name == nullptr) {
    failMessage(QVErrorInvalidRequest, "invalid request format (missing type)");
    return;
  }
  for (const Route& route : kRoutes) {
    if (*name == route.name) {
      (this->*route.handler)();
      return;
    }
  }
  if (auto handler = testRoute(*name)) {
    handler(*this);
    return;
  }
  failMessage(QVErrorInvalidRequest, "unrecognized request");
}

void Transaction::done() {
  if (finished_.exchange(true)) {
    QVLogOps().fault("a second reply to request %llu of client %d was refused",
                     static_cast<unsigned long long>(reply_.requestId()), client_->pid());
    return;
  }
  probes::requestOutput(client_->pid(),
                        [&] { return platform::Value(reply_.bodyForDescription()).description(); });
  // Sent without waiting; a client that has gone meanwhile gets nothing.
  platform::Status sent = reply_.send();
  if (sent.ok()) return;
  // The answer cannot be framed (most often: more forms than one message
  // carries). The client still gets a reply, saying why.
  QVLogOps().error("reply to request %llu of client %d not sent: %{public}@",
                   static_cast<unsigned long long>(reply_.requestId()), client_->pid(),
                   sent.error());
  reply_.replaceBody(platform::Dictionary{
      {std::string(QVDErrorCodeKey), static_cast<std::uint64_t>(QVErrorInvalidRequest)},
      {std::string(QVDErrorKey), "reply too large to send (" + sent.error().description() +
                                     "); narrow the request"}});
  (void)reply_.send();
}

void Transaction::failMessage(std::int64_t code, std::string message) {
  if (finished_.load()) {
    QVLogOps().fault("request %llu of client %d failed after its reply: %{public}s",
                     static_cast<unsigned long long>(reply_.requestId()), client_->pid(), message);
    return;
  }
  reply_.body().set(QVDErrorCodeKey, static_cast<std::uint64_t>(code));
  reply_.body().set(QVDErrorKey, std::move(message));
  done();
}

void Transaction::failError(std::int64_t code, const platform::Error& error) {
  if (error.domain() == QVQuorvexErrorDomain) {
    const std::string* text = error.localizedDescription();
    // An error of our own without a text still carries its code; the name
    // of the code is the most a client can be told then.
    const char* codeName = QVErrorCodeName(error.code());
    failMessage(error.code(), text ? *text : std::string(codeName ? codeName : "unknown error"));
    return;
  }
  const std::string* text = error.localizedDescription();
  failMessage(code, text ? *text : error.description());
}

}  // namespace qvd
