// Thread safety: for one thread.
//
// A service on sd-bus itself, since the library keeps its users from most mistakes. Checks in, serves
// on one thread, and gives up one file between two looks at its messages. One fault can be planted.
#pragma once

#include <systemd/sd-bus.h>

#include <cstdint>
#include <deque>
#include <string>

#include "tests/programs/bad_services/cache_folder.h"
#include "tests/programs/bad_services/fault.h"

namespace bad_services {

class RawService {
 public:
  RawService(Fault fault, std::string volume, std::string folder)
      : fault_(fault), volume_(std::move(volume)), folder_(std::move(folder)) {}
  ~RawService();
  RawService(const RawService&) = delete;
  RawService& operator=(const RawService&) = delete;

  /// Until the process is killed; checks in again when a connection ends.
  [[noreturn]] void run();

 private:
  struct Request {
    sd_bus_message* call = nullptr;
    std::string member;
    std::int32_t urgency = 0;
    std::string volume;
    std::uint64_t amount = 0;
    bool sensible = true;  ///< what is known is of the right type
    std::uint64_t freed = 0;
  };

  bool connect();
  bool startServing(int socket);
  bool sendCheckIn(int endpoint);
  void disconnect();
  void serveUntilLost();

  static int onMessage(sd_bus_message* message, void* self, sd_bus_error* error);
  int serve(sd_bus_message* message);
  static Request read(sd_bus_message* message);
  static void readInfo(sd_bus_message* message, Request& request);
  static void readEntry(sd_bus_message* message, Request& request);
  void answerQuery(const Request& request);
  void queuePurge(Request request);
  void cancelPurges();
  void step();
  void finish(const Request& request);
  [[nodiscard]] std::uint64_t offered(const Request& request);
  [[nodiscard]] bool wrongVolume(const Request& request) const;
  void answerAmount(const Request& request, std::uint64_t amount);
  static void answerNothing(sd_bus_message* call);
  [[nodiscard]] bool has(Fault fault) const { return fault_ == fault; }

  const Fault fault_;
  const std::string volume_;
  const CacheFolder folder_;
  sd_bus* daemon_ = nullptr;
  sd_bus* server_ = nullptr;
  std::deque<Request> purges_;
  bool cancelled_ = false;
  bool was_connected_ = false;
  bool was_slow_ = false;
  int queries_ = 0;
};

}  // namespace bad_services
