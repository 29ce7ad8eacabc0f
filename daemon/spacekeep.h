// Thread safety: every member may be called from any thread unless it says otherwise. Each guarded
// collection is touched on its own queue only, and its accessor checks that. What may be set without
// a queue is set while nobody else uses the object.
//
// The one long-lived object of the daemon. It owns the serial queues on which all work is ordered,
// the service registry, the preferences suite and the listener, and it is what the listener
// exports. This header is the table of contents; the members are implemented in the rooms they
// belong to: registry/ (snapshots, check-in, ping, notifications), client/ (entry points, dispatch)
// and here.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "client/client_protocol.h"
#include "client/history_protocol.h"
#include "client/late_changes.h"
#include "client/purge_operations.h"
#include "registry/service.h"
#include "registry/service_protocol.h"
#include "registry/service_registry.h"
#include "support/platform.h"
#include "support/queues/serial_queue.h"

namespace spacekeep {

class History;
class SpacekeepPeriodicOperation;
class SpacekeepPurgeOperation;

/// Accepts client connections and serves the daemon object to them.
using SpacekeepListener = ipc::Listener;

/// The most services that the registry takes by check-in: each holds a descriptor and a place in
/// every snapshot.
inline constexpr std::size_t kMaxRegisteredServices = 4096;
/// Of the ID of one of them. IDs stand in every outcome and in every request of a later urgency.
inline constexpr std::size_t kMaxServiceIdBytes = 255;

/// How late the daemon's own records reach the disk: many answers make one write.
inline constexpr std::uint64_t kLateWriteDelayNs = 5'000'000'000;

class Spacekeep : public SpacekeepClientProtocol,
                  public SpacekeepHistoryProtocol,
                  public std::enable_shared_from_this<Spacekeep> {
 private:
  struct Key {};

 public:
  /// `root_path` is the directory that holds System/Library/Spacekeep/.
  [[nodiscard]] static std::shared_ptr<Spacekeep> create(Platform& platform,
                                                         std::string root_path = "/");
  Spacekeep(Key, Platform& platform, std::string root_path);

  /// The one daemon object of the process, made on the first call, on the platform given to
  /// setSharedPlatform before.
  [[nodiscard]] static std::shared_ptr<Spacekeep> sharedSpacekeep();
  static void setSharedPlatform(Platform& platform, std::string root_path = "/");
  /// Forgets the object and the platform. For tests, which have many worlds in one process.
  static void resetSharedSpacekeep();

  // Fields. The queues and rootPath are constant after init.
  [[nodiscard]] const std::shared_ptr<SerialQueue>& collection_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& defaults_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& purge_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& purgeable_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& periodic_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& notify_queue() const;
  [[nodiscard]] const std::shared_ptr<SerialQueue>& daemons_queue() const;
  [[nodiscard]] const std::string& rootPath() const { return root_path_; }
  // The next four lie on no queue. The daemon sets them in init alone; set them before the first
  // client comes or after the last one has gone, from one thread.
  [[nodiscard]] SpacekeepListener* listener() const { return listener_.get(); }
  void setListener(std::unique_ptr<SpacekeepListener> listener) { listener_ = std::move(listener); }
  [[nodiscard]] const Dictionary& default_values() const { return default_values_; }
  void setDefault_values(Dictionary values) { default_values_ = std::move(values); }
  /// Declared, never used by the daemon: stays absent.
  [[nodiscard]] const std::optional<Array>& operations() const { return operations_; }
  void setOperations(std::optional<Array> operations) { operations_ = std::move(operations); }
  /// Created empty, never used by the daemon.
  [[nodiscard]] const Dictionary& optOuts() const { return opt_outs_; }
  void setOptOuts(Dictionary opt_outs) { opt_outs_ = std::move(opt_outs); }
  /// Only on defaults_queue(). Null when the suite could not be opened.
  [[nodiscard]] PreferencesSuite* userDefaults() const;
  void setUserDefaults(std::unique_ptr<PreferencesSuite> suite);
  /// Only on collection_queue().
  [[nodiscard]] const ServiceMap& services() const;
  void setServices(ServiceMap services);
  /// Only on daemons_queue(). The IDs that came from descriptor files.
  [[nodiscard]] const std::set<std::string>& daemons() const;
  void setDaemons(std::set<std::string> service_ids);
  /// Only on collection_queue(). Never assigned by the daemon, so it stays absent: no running purge
  /// is ever found by its token.
  [[nodiscard]] const std::optional<PurgeOperations>& purgeOperations() const;
  void setPurgeOperations(std::optional<PurgeOperations> operations);

  // Registry. Not from a task on collection_queue().
  [[nodiscard]] std::shared_ptr<const ServiceMap> copyServices() const;
  [[nodiscard]] ServiceMap mutableServices() const;

  /// Asks once and waits for the answer without any time limit. Always true.
  [[nodiscard]] static bool pingService(const SpacekeepServiceProtocol& proxy);
  /// Tells every service that asked for notifications called `name`. Returns at once. Not from a
  /// task on collection_queue().
  void notifyRecipients(std::string name, ipc::OptionalValue value);

  // Client entry points.
  void clientCheckin(std::string service_id, ipc::SharedDescriptor endpoint, Dictionary info,
                     CheckinReply reply) override;
  void clientPurgeableSpace(Dictionary info, DictionaryReply reply) override;
  void clientItemizedPurgeableSpace(Dictionary info, DictionaryReply reply) override;
  void clientPurge(Dictionary info, DictionaryReply reply) override;
  void clientCancelPurge(Dictionary info, EmptyReply reply) override;
  void clientSetState(ipc::OptionalValue value, std::string key, EmptyReply reply,
                      StoreFailure failed) override;
  void clientGetState(std::string key, ValueReply reply) override;
  void clientHistory(Dictionary info, HistoryReply reply, HistoryFailure failed) override;

  // Client state. Only on defaults_queue(); each has called its reply when it returns.
  /// On the disk before `reply`. A change that cannot be stored is taken back and told to `failed`,
  /// in the absence of which `reply` runs all the same.
  void _clientSetState(ipc::OptionalValue value, const std::string& key, const EmptyReply& reply,
                       const StoreFailure& failed = nullptr);
  /// `key` is a value of any kind; none but a string finds anything.
  void _clientGetState(const Value& key, const ValueReply& reply);
  /// For the daemon's own records: seen by every reader at once, on the disk within
  /// kLateWriteDelayNs. What a crash may cost of them is asked for again.
  void clientSetStateSync(StateObject value, const std::string& key);
  /// A byte string is answered as the record it is the archive of. The record is the store's own:
  /// who changes it stores it again within the same task.
  [[nodiscard]] StateObject clientGetStateSync(const std::string& key);

  // Dispatch. Each blocks until the operation has ended.
  /// The outcome of a query, none when the request was refused.
  std::optional<Dictionary> totalAvailable(const Value& info);
  /// `callback` (may be empty) gets every outcome that the operation reports; the answer is the
  /// last of them, none when the request was refused.
  std::optional<Dictionary> purge(const Value& info, OperationCompletion callback);
  void performPeriodicsWithInfo(const Value& info);
  void handleVFSStreamEvent(const Dictionary& event);
  [[nodiscard]] std::uint64_t requestsInFlight(const Array& collection) const;

  /// Walks `path` and calls `execBlock` with each document whose top level is a dictionary.
  void scanPlistsAtPath(const std::string& path,
                        const std::function<void(const Dictionary&)>& execBlock) const;

 private:
  struct CheckIn;

  void init();
  void createQueues();
  void applyStoredSettings();
  void scanDescriptors(const std::vector<std::string>& directories);
  void startListener();
  [[nodiscard]] bool connectionIsEntitled(std::string_view entitlement) const;
  void registerService(const CheckIn& check_in);
  [[nodiscard]] std::string refusalOf(const CheckIn& check_in) const;
  [[nodiscard]] std::shared_ptr<SKService> openService(const CheckIn& check_in);
  [[nodiscard]] std::function<void()> removalHandler(const std::shared_ptr<SKService>& service);
  void deliverNotification(const ServiceMap& recipients, const std::string& name,
                           const ipc::OptionalValue& value) const;
  void cancelPurgeWithToken(const Value* token);
  /// Puts a purge that has ended down for the history, with the outcome that it came to itself. On
  /// the thread that serves the request.
  void rememberPurge(const SpacekeepPurgeOperation& operation, const Dictionary& outcome) const;
  /// To be called, while the operation is there, with its outcome.
  [[nodiscard]] OperationCompletion rememberingDailyPass(
      const std::shared_ptr<SpacekeepPeriodicOperation>& operation) const;
  void answerQuery(const Value& info, std::string_view entitlement, const char* operation,
                   DictionaryReply reply);

  // Client state, on defaults_queue_.
  /// Null when there is none. Good until the suite is touched again.
  [[nodiscard]] const Value* persistentState();
  /// Without what is still to be written.
  [[nodiscard]] Dictionary storedState();
  [[nodiscard]] std::optional<Value> answerFor(const std::string& key);
  [[nodiscard]] std::optional<Value> valueIn(const Dictionary& state, const std::string& key);
  [[nodiscard]] std::optional<Value> builtIn(const std::string& key) const;
  // Each answers why it is not on the disk, if it is not.
  [[nodiscard]] std::optional<std::string> writeState(ipc::OptionalValue value,
                                                      const std::string& key);
  [[nodiscard]] std::optional<std::string> writeOut(Dictionary state);
  void actOnChange(const std::string& key, const ipc::OptionalValue& value);
  [[nodiscard]] StateObject recordOf(const std::string& key, Value value);
  void writeSoon();
  void writeNow();
  /// Also on the creating thread, before any queue is in use.
  void applySettings(const Dictionary& state);

  Platform& platform_;
  // In this order, so that they are released in the reverse one.
  std::shared_ptr<SerialQueue> collection_queue_;
  std::shared_ptr<SerialQueue> defaults_queue_;
  std::unique_ptr<SpacekeepListener> listener_;
  std::shared_ptr<SerialQueue> purge_queue_;
  std::shared_ptr<SerialQueue> purgeable_queue_;
  std::shared_ptr<SerialQueue> periodic_queue_;
  std::shared_ptr<SerialQueue> notify_queue_;
  std::shared_ptr<SerialQueue> daemons_queue_;
  std::shared_ptr<History> history_;  // null when none is kept; constant after init
  std::string root_path_;
  std::unique_ptr<PreferencesSuite> user_defaults_;  // confined to defaults_queue_
  LateChanges late_changes_;                         // confined to defaults_queue_
  bool late_write_is_due_ = false;                   // confined to defaults_queue_
  std::atomic<bool> finish_early_ = false;           // of purges that do not say
  mutable ServiceRegistry registry_;                 // confined to collection_queue_
  std::optional<Array> operations_;
  std::set<std::string> daemons_;  // confined to daemons_queue_
  Dictionary default_values_;
  Dictionary opt_outs_;
  std::optional<PurgeOperations> purge_operations_;  // confined to collection_queue_
};

}  // namespace spacekeep
