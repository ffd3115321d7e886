#pragma once

#include <functional>
#include <map>
#include <string>

#include "phone/phone.h"
#include "tests/fakes/fake_platform.h"

namespace appsync::host::testing {

/// A phone for the host over a client's fake services; what it is asked to do stands in the trace.
class FakePhone final : public IncomingFiles, public ApplicationData, public PhoneActivity {
 public:
  using Texts = std::map<std::string, std::string, std::less<>>;

  explicit FakePhone(fakes::FakePlatform& services) : services_(services) {}

  Phone phone();

  std::unique_ptr<FileReceiver> receiveFile(std::string_view path,
                                            std::optional<Error>* error) noexcept override;
  std::optional<std::vector<std::string>> namesIn(std::string_view directory,
                                                  std::optional<Error>* error) noexcept override;
  std::vector<AppRecord> applications(std::optional<Error>* error) noexcept override;
  std::optional<Bytes> opaqueBlob(std::string_view identifier,
                                  std::optional<Error>* error) noexcept override;
  bool saveData(std::string_view identifier, const DataSink& sink,
                std::optional<Error>* error) noexcept override;
  bool restoreData(std::string_view identifier, const DataSource& source,
                   std::optional<Error>* error) noexcept override;
  bool overwriteData(std::string_view identifier, const DataSource& source,
                     std::optional<Error>* error) noexcept override;
  void setWatcher(PhoneWatcher* watcher) noexcept override { onWatcher(watcher); }
  void expedite() noexcept override;
  std::set<std::string> busyAmong(const std::set<std::string>& identifiers) noexcept override;
  std::set<std::string> packagesOwedBy(CoordinationClientId responsible) noexcept override;

  bool coordination = false;
  Texts waiting;  ///< restored data, by identifier
  Texts owned;    ///< other data
  Texts blobs;
  std::string unreadableBlob;
  std::map<std::string, Error, std::less<>> dataFailures;  ///< after all of the data was given
  std::function<void(std::size_t offset)> onPiece;         ///< of data that is saved
  std::function<void(PhoneWatcher*)> onWatcher = [](PhoneWatcher*) {};
  std::function<bool(std::string_view)> isBusyWith = [](std::string_view) { return false; };

 private:
  std::optional<std::string> take(const DataSource& source, std::optional<Error>* error);

  fakes::FakePlatform& services_;
};

}  // namespace appsync::host::testing
