#include "host/restore/restore_data.h"

#include "host/backup/digest.h"

namespace appsync::host {
namespace {

/// The archive of an application without data has no bytes.
bool isSame(const Phone& phone, const std::string& identifier, const BackupFile* file) {
  Sha256 digest;
  std::uint64_t size = 0;
  const std::uint64_t expected = file ? file->size : 0;
  const auto compare = [&](ByteView bytes) {
    digest.add(bytes);
    size += bytes.size();
    return size <= expected;
  };
  return phone.data.saveData(identifier, compare, nullptr) && size == expected &&
         (!file || digest.finish() == file->digest);
}

/// Reports each hundredth.
class ReportedData {
 public:
  ReportedData(const BackedUpApplication& app, const BackupFile& file, Reporter& reporter)
      : app_(app), total_(file.size), reader_(file), reporter_(reporter) {}

  std::int64_t read(std::uint8_t* bytes, std::size_t size) {
    const std::int64_t count = reader_.read(bytes, size);
    const std::uint64_t hundredths = total_ == 0 ? 100 : reader_.position() * 100 / total_;
    if (count > 0 && hundredths > reported_) {
      reported_ = hundredths;
      reporter_.report(DataProgress{app_.identifier, app_.name, reader_.position(), total_});
    }
    return count;
  }
  const std::string& problem() const { return reader_.problem(); }

 private:
  const BackedUpApplication& app_;
  const std::uint64_t total_;
  BackupFileReader reader_;
  Reporter& reporter_;
  std::uint64_t reported_ = 0;
};

using Taker = decltype(&ApplicationData::restoreData);

std::optional<std::string> giveData(const Phone& phone, Taker taker, const BackedUpApplication& app,
                                    const BackupFile& file, Reporter& reporter,
                                    const Interruption& interruption) {
  ReportedData data(app, file, reporter);
  const auto source = [&](std::uint8_t* bytes, std::size_t size) {
    return interruption.requested() ? -1 : data.read(bytes, size);
  };
  std::optional<Error> error;
  if ((phone.data.*taker)(app.identifier, source, &error)) return std::nullopt;
  if (!data.problem().empty()) return "its data in the backup is damaged: " + data.problem();
  if (interruption.requested()) return InterruptedReason;
  return withReason("its data could not be given back", error);
}

/// What an earlier restore left waiting belongs to another backup.
std::optional<std::string> clear(const Phone& phone, const std::string& identifier) {
  const auto nothing = [](std::uint8_t*, std::size_t) { return std::int64_t{0}; };
  std::optional<Error> error;
  if (phone.data.restoreData(identifier, nothing, &error)) return std::nullopt;
  return withReason("older data that waits for it could not be removed", error);
}

}  // namespace

bool hasData(const Phone& phone, const std::string& identifier, const BackupFile& file) {
  return isSame(phone, identifier, &file);
}

std::optional<std::string> overwriteData(const Phone& phone, const BackedUpApplication& app,
                                         const BackupFile& file, Reporter& reporter,
                                         const Interruption& interruption) {
  auto failure =
      giveData(phone, &ApplicationData::overwriteData, app, file, reporter, interruption);
  reporter.report(DataEnded{app.identifier, failure});
  return failure;
}

std::optional<std::string> giveBackData(const Phone& phone, const BackedUpApplication& app,
                                        const BackupFile* file, Reporter& reporter,
                                        const Interruption& interruption) {
  if (isSame(phone, app.identifier, file)) return std::nullopt;
  if (!file) return clear(phone, app.identifier);
  auto failure = giveData(phone, &ApplicationData::restoreData, app, *file, reporter, interruption);
  reporter.report(DataEnded{app.identifier, failure});
  return failure;
}

}  // namespace appsync::host
