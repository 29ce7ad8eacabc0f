// Thread safety: every member may be called from any thread.
//
// A connection and a connector under the control of a test: calls wait until the test answers or
// fails them. Answers and failures run on the global queue, as the contract of Connection says.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "support/ipc/connection.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::test {

class FakeConnection final : public ipc::Connection,
                             public std::enable_shared_from_this<FakeConnection> {
 public:
  explicit FakeConnection(ConcurrentQueue& global) : global_(global) {}

  void setInvalidationHandler(Handler) override {}
  void setInterruptionHandler(Handler) override {}
  void setRemoteInterface(const ipc::InterfaceDescription&) override {}
  void resume() override {}
  void invalidate() override { failAll(); }
  [[nodiscard]] bool ended() const override { return false; }

  std::shared_ptr<ipc::RemoteProxy> remoteProxy(ipc::RemoteProxy::ErrorHandler on_error) override {
    return std::make_shared<Proxy>(shared_from_this(), std::move(on_error));
  }

  [[nodiscard]] std::vector<std::string> members() const {
    const std::scoped_lock lock(mutex_);
    return members_;
  }
  void answerAll() {
    for (Call& call : takeOpen()) {
      global_.async([reply = std::move(call.reply)] { reply({}); });
    }
  }
  void failAll() {
    for (Call& call : takeOpen()) {
      global_.async([on_error = std::move(call.on_error)] { on_error({"test.Error", "failed"}); });
    }
  }

 private:
  struct Call {
    ipc::RemoteProxy::ReplyHandler reply;
    ipc::RemoteProxy::ErrorHandler on_error;
  };
  class Proxy final : public ipc::RemoteProxy {
   public:
    Proxy(std::shared_ptr<FakeConnection> connection, ErrorHandler on_error)
        : connection_(std::move(connection)), on_error_(std::move(on_error)) {}
    void call(std::string_view member, ipc::Arguments, ReplyHandler reply) override {
      const std::scoped_lock lock(connection_->mutex_);
      connection_->members_.emplace_back(member);
      connection_->open_.push_back({std::move(reply), on_error_});
    }

   private:
    const std::shared_ptr<FakeConnection> connection_;
    const ErrorHandler on_error_;
  };

  std::vector<Call> takeOpen() {
    const std::scoped_lock lock(mutex_);
    return std::exchange(open_, {});
  }

  ConcurrentQueue& global_;
  mutable rt::Mutex mutex_;
  std::vector<Call> open_;            // protected by mutex_
  std::vector<std::string> members_;  // protected by mutex_
};

/// Reaches the declared services that the test has put into it.
class FakeConnector final : public ipc::Connector {
 public:
  std::shared_ptr<ipc::Connection> connectionFromEndpoint(ipc::SharedDescriptor) override {
    return nullptr;
  }
  std::shared_ptr<ipc::Connection> connectionToDeclared(const std::string& service_id,
                                                        const ipc::InterfaceDescription&) override {
    const auto found = declared.find(service_id);
    return found == declared.end() ? nullptr : found->second;
  }

  std::map<std::string, std::shared_ptr<ipc::Connection>> declared;  ///< constant while calls run
};

}  // namespace spacekeep::test
