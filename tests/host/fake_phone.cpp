#include "tests/host/fake_phone.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <cerrno>

namespace appsync::host::testing {
namespace {

constexpr std::size_t PieceSize = 1000;

/// A package arriving, in the trace from its begin to its end.
class FakeReceiver final : public FileReceiver {
 public:
  FakeReceiver(fakes::FakePlatform& services, std::string_view path)
      : services_(services), path_(path) {}

  bool append(ByteView bytes, std::optional<Error>* error) noexcept override {
    if (services_.faults.strikes("phone.append", path_, error)) return false;
    received_.insert(received_.end(), bytes.begin(), bytes.end());
    return true;
  }

  bool finish(Durability durability, std::optional<Error>* error) noexcept override {
    if (services_.faults.strikes("phone.finish", path_, error)) return false;
    services_.trace.add(fakes::TraceFile,
                        fmt::format("phone.received({}{})", path_,
                                    durability == Durability::Durable ? ", durable" : ""));
    services_.files.putFile(path_, received_);
    return true;
  }

 private:
  fakes::FakePlatform& services_;
  const std::string path_;
  Bytes received_;
};

}  // namespace

Phone FakePhone::phone() {
  return {services_.faultyFiles,
          services_.faultyRegistry,
          services_.homeScreen,
          services_.iconRenderer,
          services_.imageEncoders,
          *this,
          *this,
          *this,
          coordination ? &services_.installCoordination : nullptr};
}

std::unique_ptr<FileReceiver> FakePhone::receiveFile(std::string_view path,
                                                     std::optional<Error>* error) noexcept {
  if (services_.faults.strikes("phone.receive", path, error)) return nullptr;
  services_.trace.add(fakes::TraceFile, fmt::format("phone.receive({})", path));
  return std::make_unique<FakeReceiver>(services_, path);
}

std::optional<std::vector<std::string>> FakePhone::namesIn(std::string_view directory,
                                                           std::optional<Error>*) noexcept {
  std::vector<std::string> names;
  const std::string parent = std::string(directory) + "/";
  for (const auto& file : services_.files.files()) {
    const bool below = file.first.starts_with(parent);
    const std::string name = below ? file.first.substr(parent.size()) : "";
    if (below && name.find('/') == std::string::npos) names.push_back(name);
  }
  return names;
}

/// As a phone gives them: sorted, placeholders last.
std::vector<AppRecord> FakePhone::applications(std::optional<Error>* error) noexcept {
  std::vector<AppRecord> all;
  if (services_.faults.strikes("phone.applications", "", error)) return all;
  services_.appRegistry.enumerateBundles(
      BundleKind::All, [&](const AppRecord& record, bool&) { all.push_back(record); });
  std::ranges::sort(all, {}, [](const AppRecord& record) {
    return std::pair(record.applicationIdentifier, record.isPlaceholder);
  });
  return all;
}

std::optional<Bytes> FakePhone::opaqueBlob(std::string_view identifier,
                                           std::optional<Error>* error) noexcept {
  if (identifier == unreadableBlob) setError(error, Error::posix(EIO));
  const auto blob = blobs.find(identifier);
  return blob == blobs.end() ? std::nullopt : std::optional(toBytes(blob->second));
}

bool FakePhone::saveData(std::string_view identifier, const DataSink& sink,
                         std::optional<Error>* error) noexcept {
  if (services_.faults.strikes("phone.saveData", identifier, error)) return false;
  const Texts& all = waiting.contains(identifier) ? waiting : owned;
  const auto found = all.find(identifier);
  const std::string_view data = found == all.end() ? "" : std::string_view(found->second);
  for (std::size_t begin = 0; begin < data.size(); begin += PieceSize) {
    if (onPiece) onPiece(begin);
    if (sink(asBytes(data.substr(begin, PieceSize)))) continue;
    setError(error, Error::posix(ECANCELED));
    return false;
  }
  const auto failure = dataFailures.find(identifier);
  if (failure == dataFailures.end()) return true;
  setError(error, failure->second);
  return false;
}

bool FakePhone::restoreData(std::string_view identifier, const DataSource& source,
                            std::optional<Error>* error) noexcept {
  if (services_.faults.strikes("phone.restoreData", identifier, error)) return false;
  const auto data = take(source, error);
  if (!data) return false;
  services_.trace.add(fakes::TraceCall,
                      fmt::format("phone.restoreData({}, {})", identifier, *data));
  waiting.erase(std::string(identifier));
  if (!data->empty()) waiting.emplace(identifier, *data);
  return true;
}

bool FakePhone::overwriteData(std::string_view identifier, const DataSource& source,
                              std::optional<Error>* error) noexcept {
  if (services_.faults.strikes("phone.overwriteData", identifier, error)) return false;
  const auto data = take(source, error);
  if (!data) return false;
  services_.trace.add(fakes::TraceCall,
                      fmt::format("phone.overwriteData({}, {})", identifier, *data));
  owned[std::string(identifier)] = *data;
  return true;
}

std::optional<std::string> FakePhone::take(const DataSource& source, std::optional<Error>* error) {
  std::string data;
  std::array<std::uint8_t, PieceSize> piece{};
  std::int64_t count = 0;
  while ((count = source(piece.data(), piece.size())) > 0) {
    data.append(piece.begin(), piece.begin() + count);
  }
  if (count == 0) return data;
  setError(error, Error::posix(ECANCELED));
  return std::nullopt;
}

void FakePhone::expedite() noexcept { services_.trace.add(fakes::TraceCall, "phone.expedite"); }

std::set<std::string> FakePhone::busyAmong(const std::set<std::string>& identifiers) noexcept {
  std::set<std::string> busy;
  for (const std::string& identifier : identifiers) {
    if (isBusyWith(identifier)) busy.insert(identifier);
  }
  return busy;
}

std::set<std::string> FakePhone::packagesOwedBy(CoordinationClientId responsible) noexcept {
  std::set<std::string> owed;
  for (const std::string& identifier : services_.appRegistry.placeholderIdentifiers()) {
    const auto coordinator = services_.installCoordination.coordinator(identifier);
    if (!coordinator || coordinator->error()) continue;
    const auto state = coordinator->state();
    const bool came = state.appAssetPromise && state.appAssetPromise->isComplete();
    if (state.responsibleClient == responsible && !came) owed.insert(identifier);
  }
  return owed;
}

}  // namespace appsync::host::testing
