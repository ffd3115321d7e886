#pragma once

#include <map>
#include <string>
#include <thread>
#include <vector>

#include "device/state/background_queue.h"
#include "platform/mutex.h"
#include "platform/system_notifier.h"

namespace appsync::device {

/// Named notifications inside this process. Callbacks run one after another, in the order of the
/// postings and in that of the observers' being added, on a thread of the notifier; an observer is
/// called for the postings made after it was added. A state belongs to a name: every token of the
/// name sets the same one.
class LocalNotifier final : public SystemNotifier {
 public:
  /// Drops what is posted but not yet delivered and lets a running callback end. Not to be called
  /// from a callback.
  ~LocalNotifier() override;

  /// Fails (status 1) only for an empty name.
  Registration registerCheck(std::string_view name) noexcept override;
  void setState(int token, std::uint64_t state) noexcept override;
  void post(std::string_view name) noexcept override;
  void addObserver(void* observer, std::string_view name, Callback callback) noexcept override;
  /// From inside the observer's own callback it does not wait for that callback.
  void removeObserver(void* observer, std::string_view name) noexcept override;

  /// The state last set for the name; 0 when none was.
  std::uint64_t state(std::string_view name) noexcept;

 private:
  struct Subscription {
    void* observer;
    std::string name;
    Callback callback;
    std::uint64_t since;  ///< number of postings made before
  };
  struct Posting {
    std::string name;
    std::uint64_t number;
  };

  void deliver(const Posting& posting);

  Mutex mutex_;
  Condition returned_;                                              ///< a callback has returned
  std::vector<std::string> tokenNames_ APPSYNC_GUARDED_BY(mutex_);  ///< of token n + 1
  std::map<std::string, std::uint64_t, std::less<>> states_ APPSYNC_GUARDED_BY(mutex_);
  /// In the order they were added.
  std::map<std::uint64_t, Subscription> subscriptions_ APPSYNC_GUARDED_BY(mutex_);
  std::uint64_t lastSubscription_ APPSYNC_GUARDED_BY(mutex_) = 0;
  /// Subscription being called, 0 for none.
  std::uint64_t running_ APPSYNC_GUARDED_BY(mutex_) = 0;
  std::uint64_t postingCount_ APPSYNC_GUARDED_BY(mutex_) = 0;
  std::thread::id deliverer_ APPSYNC_GUARDED_BY(mutex_);

  ThreadBackgroundQueue queue_;  ///< one task for each posting
};

}  // namespace appsync::device
