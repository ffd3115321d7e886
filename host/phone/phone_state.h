#pragma once

#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "phone/phone.h"
#include "platform/existence.h"
#include "platform/sync_files.h"

namespace appsync::host {

/// Whether an application that has only a placeholder has data of its own, which it made before it
/// lost its package and which is worth more than a backup's; nullopt (with an error) when that
/// cannot be told.
[[nodiscard]] std::optional<bool> ownsData(const Phone& phone, const std::string& identifier,
                                           std::optional<Error>* error);

/// Whether there is data of the application, its own or waiting; nullopt (with an error) when that
/// cannot be told.
[[nodiscard]] std::optional<bool> hasAnyData(const Phone& phone, const std::string& identifier,
                                             std::optional<Error>* error);

/// Waits until the phone has nothing left to do for these applications by itself.
void waitUntilIdle(const Phone& phone, const std::set<std::string>& identifiers);

/// The registry's records (see ApplicationData::applications); nullopt (with an error) when it
/// cannot be read.
[[nodiscard]] std::optional<std::vector<AppRecord>> applicationsOf(const Phone& phone,
                                                                   std::optional<Error>* error);

/// The applications that the registry knows.
struct ApplicationsPresent {
  std::set<std::string, std::less<>> installed;
  std::map<std::string, AppRecord, std::less<>> placeholders;
};
/// nullopt (with an error) when the registry cannot be read.
[[nodiscard]] std::optional<ApplicationsPresent> applicationsPresent(const Phone& phone,
                                                                     std::optional<Error>* error);

/// "<what>: <the error's description>", or only what, for people.
std::string withReason(std::string_view what, const std::optional<Error>& error);

inline constexpr std::string_view CannotTellApplications =
    "the phone's applications cannot be told";

/// Shows the store's downloads but `except` as under way, which they are once a person has asked
/// for them: the client asks the host for the package of every other placeholder, and takes it away
/// when the host has none. False (with an error) when the registry cannot be read.
[[nodiscard]] bool claimDownloads(const Phone& phone, const std::set<std::string>& except,
                                  std::optional<Error>* error);

/// What an entry of the todo list says of an application.
struct TodoState {
  std::string identifier;
  std::string operation;
};

/// The todo list in a directory of the phone, empty when there is none; nullopt (with an error)
/// when it cannot be read.
[[nodiscard]] std::optional<std::vector<TodoState>> readTodoList(
    FileManager& files, std::string_view directory, std::optional<Error>* error = nullptr);

}  // namespace appsync::host
