// The D-Bus peers through the low-level libdbus-1 API: no bindings, no main
// loop, so what is measured is the bus itself (two socket hops through
// dbus-daemon and its routing) plus message marshalling.
#include <dbus/dbus.h>
#include <errno.h>

#include <cstdio>
#include <vector>

#include "bench/suite/EchoPeers.h"

namespace bench::suite {
namespace {

constexpr const char* kName = "com.corvane.bench.Echo";
constexpr const char* kPath = "/com/corvane/bench/Echo";
constexpr const char* kInterface = "com.corvane.bench.Echo";
constexpr const char* kMethod = "Echo";

// A private connection, registered with the bus; null with the reason on
// standard error when it cannot be had.
DBusConnection* open(const std::string& address) {
  DBusError error;
  dbus_error_init(&error);
  DBusConnection* connection = dbus_connection_open_private(address.c_str(), &error);
  if (connection == nullptr || !dbus_bus_register(connection, &error)) {
    std::fprintf(stderr, "dbus: %s\n", error.message ? error.message : "cannot connect");
    dbus_error_free(&error);
    if (connection != nullptr) {
      dbus_connection_close(connection);
      dbus_connection_unref(connection);
    }
    return nullptr;
  }
  // A lost bus is reported by the calls failing, not by ending this process.
  dbus_connection_set_exit_on_disconnect(connection, FALSE);
  return connection;
}

bool appendBytes(DBusMessage* message, const std::vector<unsigned char>& bytes) {
  const unsigned char* data = bytes.data();
  return dbus_message_append_args(message, DBUS_TYPE_ARRAY, DBUS_TYPE_BYTE, &data,
                                  static_cast<int>(bytes.size()), DBUS_TYPE_INVALID);
}

}  // namespace

bool dbusAvailable() {
  return true;
}

int runDBusEcho(const std::string& address, std::size_t replyBytes) {
  DBusConnection* connection = open(address);
  if (connection == nullptr) return 1;
  DBusError error;
  dbus_error_init(&error);
  if (dbus_bus_request_name(connection, kName, DBUS_NAME_FLAG_DO_NOT_QUEUE, &error) !=
      DBUS_REQUEST_NAME_REPLY_PRIMARY_OWNER) {
    std::fprintf(stderr, "dbus: cannot own %s\n", kName);
    return 1;
  }
  std::printf("ready\n");
  std::fflush(stdout);
  const std::vector<unsigned char> reply(replyBytes, 'y');
  while (dbus_connection_read_write(connection, -1)) {
    while (DBusMessage* message = dbus_connection_pop_message(connection)) {
      if (dbus_message_is_method_call(message, kInterface, kMethod)) {
        // The request's bytes are read as a service would read its input.
        const unsigned char* data = nullptr;
        int length = 0;
        if (dbus_message_get_args(message, nullptr, DBUS_TYPE_ARRAY, DBUS_TYPE_BYTE, &data,
                                  &length, DBUS_TYPE_INVALID)) {
          DBusMessage* answer = dbus_message_new_method_return(message);
          appendBytes(answer, reply);
          dbus_connection_send(connection, answer, nullptr);
          dbus_connection_flush(connection);
          dbus_message_unref(answer);
        }
      } else if (dbus_message_is_signal(message, DBUS_INTERFACE_LOCAL, "Disconnected")) {
        dbus_message_unref(message);
        return 0;
      }
      dbus_message_unref(message);
    }
  }
  return 0;
}

struct DBusCaller::State {
  DBusConnection* connection = nullptr;
  std::vector<unsigned char> request;
};

DBusCaller::DBusCaller(std::unique_ptr<State> state) : state_(std::move(state)) {}

platform::Result<std::unique_ptr<DBusCaller>> DBusCaller::connect(const std::string& address,
                                                                  std::size_t requestBytes) {
  auto state = std::make_unique<State>();
  state->connection = open(address);
  if (state->connection == nullptr) return platform::Error::posix(ECONNREFUSED, "dbus " + address);
  state->request.assign(requestBytes, 'x');
  return std::unique_ptr<DBusCaller>(new DBusCaller(std::move(state)));
}

DBusCaller::~DBusCaller() {
  dbus_connection_close(state_->connection);
  dbus_connection_unref(state_->connection);
}

bool DBusCaller::once() {
  DBusMessage* call = dbus_message_new_method_call(kName, kPath, kInterface, kMethod);
  if (call == nullptr || !appendBytes(call, state_->request)) return false;
  DBusError error;
  dbus_error_init(&error);
  DBusMessage* reply =
      dbus_connection_send_with_reply_and_block(state_->connection, call, 5000, &error);
  dbus_message_unref(call);
  if (reply == nullptr) {
    std::fprintf(stderr, "dbus call: %s\n", error.message ? error.message : "no reply");
    dbus_error_free(&error);
    return false;
  }
  const unsigned char* data = nullptr;
  int length = 0;
  const bool ok = dbus_message_get_args(reply, nullptr, DBUS_TYPE_ARRAY, DBUS_TYPE_BYTE, &data,
                                        &length, DBUS_TYPE_INVALID);
  dbus_message_unref(reply);
  return ok && length > 0;
}

}  // namespace bench::suite
