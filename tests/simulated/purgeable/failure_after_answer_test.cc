// A connection that fails once its service has answered.
#include <gtest/gtest.h>

#include "registry/service_protocol.h"
#include "support/services/call_service.h"
#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Answers each call with 5 bytes, and tells the proxy's error handler afterwards that it has ended.
class EndsAfterItsAnswer final : public ipc::Connection, public ipc::Connector {
 public:
  explicit EndsAfterItsAnswer(ConcurrentQueue& global) : global_(global) {}

  void setInvalidationHandler(Handler) override {}
  void setInterruptionHandler(Handler) override {}
  void setRemoteInterface(const ipc::InterfaceDescription&) override {}
  void resume() override {}
  void invalidate() override {}
  [[nodiscard]] bool ended() const override { return false; }
  std::shared_ptr<ipc::RemoteProxy> remoteProxy(ipc::RemoteProxy::ErrorHandler on_error) override {
    return std::make_shared<Proxy>(global_, std::move(on_error));
  }

  std::shared_ptr<ipc::Connection> connectionFromEndpoint(ipc::SharedDescriptor) override {
    return unowned();
  }
  std::shared_ptr<ipc::Connection> connectionToDeclared(const std::string&,
                                                        const ipc::InterfaceDescription&) override {
    return unowned();
  }

 private:
  class Proxy final : public ipc::RemoteProxy {
   public:
    Proxy(ConcurrentQueue& global, ErrorHandler on_error)
        : global_(global), on_error_(std::move(on_error)) {}

    void call(std::string_view, ipc::Arguments, ReplyHandler reply) override {
      global_.async([reply = std::move(reply), on_error = on_error_] {
        reply({ipc::OptionalDictionary(Dictionary{{keys::kAmount, 5}})});
        on_error({"com.quorvel.Error.Disconnected", "the connection has ended"});
      });
    }

   private:
    ConcurrentQueue& global_;
    const ErrorHandler on_error_;
  };

  std::shared_ptr<ipc::Connection> unowned() { return {std::shared_ptr<ipc::Connection>(), this}; }

  ConcurrentQueue& global_;
};

TEST(QueryAnswers, AConnectionThatFailsAfterTheAnswerIsNoFailureOfTheQuery) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", couldFree(7));
    world.start();
    EndsAfterItsAnswer connector(world.platform.global);
    ServiceCaller caller(world.platform.global, connector, spacekeepServiceInterface());
    Platform platform{.global = world.platform.global,
                      .volumes = world.platform.volumes,
                      .access = world.platform.access,
                      .statistics = world.platform.statistics,
                      .files = world.platform.files,
                      .connector = connector,
                      .services = caller,
                      .openPreferencesSuite = world.platform.openPreferencesSuite,
                      .makeListener = world.platform.makeListener,
                      .after = world.platform.after,
                      .createSpacekeepToken = world.platform.createSpacekeepToken};
    const auto operation = makeOperation<SpacekeepPurgeableOperation>(
        platform, Dictionary{{keys::kVolume, "/"}}, world.daemon->copyServices(), world.daemon);
    EXPECT_EQ(world.run(*operation), resultOf({{"cache", 5}}, 5));
    EXPECT_TRUE(world.eventually([&] { return world.lines("%s calling %@ failed: %@") == 1; }));
    world.world.shutDown();
    EXPECT_EQ(world.lines("%s connection invalidated: %@"), 0U);
    EXPECT_EQ(world.lines("%s trying to remove \"%@\", which is not inFlight"), 0U);
  });
}

}  // namespace
}  // namespace spacekeep::test
