// Thread safety: every member may be called from any thread.
//
// A small stand-in for the daemon: a real listening socket that serves the client interface with
// handlers of the test's choice, and keeps the services that check in.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "client/history_protocol.h"
#include "registry/service_protocol.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/waiting.h"
#include "support/runtime/guarded.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sdk {

/// A private directory in which sockets stand for the time of a test.
class SocketDirectory {
 public:
  SocketDirectory() {
    char name[] = "/tmp/spacekeep-sdk-XXXXXX";
    path_ = mkdtemp(name);
  }
  ~SocketDirectory() {
    for (const auto* file : {"/daemon.sock", "/service.sock"}) unlink((path_ + file).c_str());
    rmdir(path_.c_str());
  }
  SocketDirectory(const SocketDirectory&) = delete;
  SocketDirectory& operator=(const SocketDirectory&) = delete;

  [[nodiscard]] const std::string& path() const { return path_; }
  [[nodiscard]] std::string daemonSocket() const { return path_ + "/daemon.sock"; }
  [[nodiscard]] std::string serviceSocket() const { return path_ + "/service.sock"; }

 private:
  std::string path_;
};

/// Waits until `condition` holds, for at most twenty seconds; answers whether it does.
inline bool eventually(const std::function<bool()>& condition) {
  const std::uint64_t deadline = rt::deadlineAfterNs(20'000'000'000);
  while (!condition()) {
    if (rt::ticks() > deadline) return false;
    rt::sleepNs(2'000'000);
  }
  return true;
}

class FakeDaemon {
 public:
  using Serve = std::function<void(ipc::Arguments, ipc::Responder)>;

  /// Listens, but serves nothing until start().
  explicit FakeDaemon(std::string socket_path) : socket_path_(std::move(socket_path)) {
    for (const auto* each = &spacekeepClientInterfaces(); each != nullptr; each = each->beside) {
      for (const auto& method : each->methods) {
        handlers_[std::string(method.name)] = [](const ipc::Arguments&, const ipc::Responder& r) {
          r.fail({"org.freedesktop.DBus.Error.NotSupported",
                  "the test did not say how to serve this"});
        };
      }
    }
  }
  ~FakeDaemon() { stop(); }
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  /// Before start().
  void on(const std::string& member, Serve serve) { handlers_.at(member) = std::move(serve); }
  void turnEverybodyAway() { admit_ = false; }

  void start() {
    std::string why;
    const auto listening = ipc::bindListeningSocket(socket_path_, 0666, why);
    ASSERT_NE(listening, nullptr) << why;
    ipc::ServerOptions options;
    options.refuse_own_process = false;
    options.admit = [admit = admit_](ipc::PeerConnection&, std::string& reason) {
      if (!admit) reason = "the test turns everybody away";
      return admit;
    };
    server_ = std::make_unique<ipc::BusServer>(loop, queue, interface(), options);
    server_->serveListening(listening);
  }

  /// start(), and stop() at the end of the scope: what the handlers refer to must be declared
  /// before.
  [[nodiscard]] auto run() {
    start();
    struct Stop {
      void operator()(FakeDaemon* daemon) const { daemon->stop(); }
    };
    return std::unique_ptr<FakeDaemon, Stop>(this);
  }

  /// As if the daemon's process had ended: every connection closes, nobody listens.
  void stop() {
    connections_.update([](auto& connections) {
      for (const auto& connection : connections) connection->invalidate();
      connections.clear();
    });
    server_.reset();
    unlink(socket_path_.c_str());
  }

  /// The connection back to a service, as the registry makes it.
  SpacekeepServiceProtocol connectTo(const ipc::SharedDescriptor& endpoint) {
    auto connection = ipc::connectionFromDescriptor(loop, queue, endpoint);
    connection->setRemoteInterface(spacekeepServiceInterface());
    auto proxy = connection->remoteProxy([this](const ipc::Error& error) {
      service_errors.update(
          [&](auto& errors) { errors.push_back(error.name + ": " + error.text); });
    });
    connection->resume();
    connections_.update([&](auto& connections) { connections.push_back(std::move(connection)); });
    return SpacekeepServiceProtocol(std::move(proxy));
  }
  /// Closes the connections to the services only.
  void dropServices() {
    connections_.update([](auto& connections) {
      for (const auto& connection : connections) connection->invalidate();
      connections.clear();
    });
  }

  /// A check-in as the daemon does it: connect back, ping, and answer once the pong is there.
  Serve registering(rt::Guarded<std::vector<std::shared_ptr<SpacekeepServiceProtocol>>>& services) {
    return [this, &services](const ipc::Arguments& in, ipc::Responder responder) {
      auto service = std::make_shared<SpacekeepServiceProtocol>(
          connectTo(std::get<ipc::SharedDescriptor>(in.at(1))));
      const std::string id = std::get<std::string>(in.at(0));
      service->servicePing([service, id, responder = std::move(responder), &services] {
        services.update([&](auto& list) { list.push_back(service); });
        responder.reply({ipc::OptionalDictionary(Dictionary{{"SPACEKEEP_ID", id}, {"ANON", true}}),
                         ipc::OptionalString()});
      });
    };
  }

  rt::Guarded<std::vector<std::string>> service_errors;
  ConcurrentQueue queue{{.name = "daemon", .parallelism = 4, .idle_worker_ns = 1'000'000'000}};
  ipc::IpcLoop loop;

 private:
  ipc::ServedInterface interface() {
    ipc::ServedInterface served{&spacekeepClientInterfaces(), {}};
    for (const auto& [name, serve] : handlers_) {
      served.methods.push_back({.name = name,
                                .mode = ipc::ServeMode::kInOrder,
                                .lane = {},
                                .lane_width = 1,
                                .serve = serve});
    }
    return served;
  }

  const std::string socket_path_;
  std::map<std::string, Serve> handlers_;
  bool admit_ = true;
  rt::Guarded<std::vector<std::shared_ptr<ipc::Connection>>> connections_;
  std::unique_ptr<ipc::BusServer> server_;
};

inline ipc::Arguments outcome(Dictionary dictionary) {
  return {ipc::OptionalDictionary(std::move(dictionary))};
}
inline ipc::Arguments noDictionary() { return {ipc::OptionalDictionary()}; }

}  // namespace spacekeep::sdk
