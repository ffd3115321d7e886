#include "host/library/sync_plan.h"

#include <fmt/format.h>

#include <algorithm>
#include <compare>
#include <map>
#include <set>

#include "base/text.h"
#include "host/library/version.h"

namespace appsync::host {
namespace {

constexpr std::string_view RemovingForbidden =
    "removing applications is forbidden on the phone (appsync policy --removing allow)";

constexpr std::string_view BelongsToSystem = "it is a system application";
constexpr std::string_view WaitsUnmirrored =
    "not removed: it waits as a placeholder (--remove takes it away with its data)";
constexpr const char* Installed = " is installed";
constexpr const char* InstalledInPart =
    " is installed without its executable, and the library has only an older one";

std::string versionText(std::string_view version) {
  return version.empty() ? std::string("a version without number")
                         : "version " + printable(version);
}

class Planner {
 public:
  Planner(const Library& library, const std::vector<InstalledApplication>& installed,
          const PlanOptions& options)
      : library_(library),
        options_(options),
        wanted_(options.install.begin(), options.install.end()),
        unwanted_(options.remove.begin(), options.remove.end()) {
    for (const InstalledApplication& application : installed) {
      installed_.emplace(application.identifier, application);
    }
  }

  std::optional<std::string> contradiction() const {
    for (const std::string& identifier : wanted_) {
      if (unwanted_.count(identifier) > 0) {
        return fmt::format("{} is to be both installed and removed", printable(identifier));
      }
      if (!library_.find(identifier)) {
        const std::size_t unread = library_.unreadable.size();
        return fmt::format("no package for {} in {}{}", printable(identifier),
                           printable(library_.folder.string()),
                           unread == 0 ? "" : fmt::format(" (unreadable files: {})", unread));
      }
    }
    for (const std::string& identifier : unwanted_) {
      if (!find(identifier) && !library_.find(identifier)) {
        return fmt::format("{} is neither on the phone nor in {}", printable(identifier),
                           printable(library_.folder.string()));
      }
    }
    if (options_.mirror && library_.packages.empty()) {
      return fmt::format("{} holds no packages: --mirror would remove every application",
                         printable(library_.folder.string()));
    }
    return std::nullopt;
  }

  SyncPlan plan() {
    for (const std::string& identifier : unwanted_) remove(identifier, true);
    if (options_.mirror) mirror();
    for (const auto& [identifier, package] : library_.packages) {
      if (unwanted_.count(identifier) > 0) continue;
      const bool named = wanted_.count(identifier) > 0;
      if (!named && isUntold(package)) {
        plan_.entries.push_back(
            {Action::Install, identifier, package.version, {}, package.name, false, false});
      } else if (named || wanted_.empty()) {
        install(package);
      }
    }
    return std::move(plan_);
  }

 private:
  const InstalledApplication* find(std::string_view identifier) const {
    const auto found = installed_.find(identifier);
    return found == installed_.end() ? nullptr : &found->second;
  }

  void skip(std::string_view identifier, std::string_view reason, bool upToDate = false) {
    plan_.skipped.push_back({std::string(identifier), std::string(reason), upToDate});
  }

  /// What nobody named may stay undone.
  void refuse(std::string_view identifier, std::string_view reason, bool named,
              bool ofRemoval = false) {
    if (!named) return skip(identifier, reason);
    plan_.failed.push_back({std::string(identifier), std::string(reason), {}, ofRemoval});
  }

  void remove(const std::string& identifier, bool named) {
    const InstalledApplication* application = find(identifier);
    if (!application) return skip(identifier, "it is not installed");
    if (application->isSystem) return refuse(identifier, BelongsToSystem, named, true);
    if (!options_.removingAllowed) return refuse(identifier, RemovingForbidden, named, true);
    plan_.entries.push_back({Action::Remove, identifier, application->version, application->version,
                             application->name, false, named});
  }

  /// A file that cannot be read may be the package of any application.
  void mirror() {
    for (const auto& [identifier, application] : installed_) {
      if (application.isSystem || library_.find(identifier) || unwanted_.count(identifier) > 0) {
        continue;
      }
      if (application.isPlaceholder) {
        skip(identifier, WaitsUnmirrored);
        continue;
      }
      const auto unread = std::find_if(library_.unreadable.begin(), library_.unreadable.end(),
                                       [](const auto& file) { return file.looksLikePackage; });
      if (unread == library_.unreadable.end()) {
        remove(identifier, false);
      } else {
        skip(identifier, fmt::format("not removed: its package may be {}, which cannot be read",
                                     printable(unread->file)));
      }
    }
  }

  /// Whether all that is left to do for an install is to tell of it.
  bool isUntold(const PackageFacts& package) const {
    const InstalledApplication* application = find(package.identifier);
    return application && application->isUntold && !application->isDamaged &&
           !package.version.empty() && application->version == package.version;
  }

  void install(const PackageFacts& package) {
    const InstalledApplication* application = find(package.identifier);
    const bool isInstalled = application && !application->isPlaceholder;
    const std::string current = isInstalled ? application->version : std::string();
    const bool named = !wanted_.empty();
    if (application && application->isSystem) {
      return refuse(package.identifier, BelongsToSystem, named);
    }
    if (application && application->isDemoted && !named) {
      return skip(package.identifier, StaysDemoted);
    }
    Action action = Action::Install;
    if (isInstalled) {
      const auto order = compareVersions(package.version, current);
      action = std::is_gt(order)   ? Action::Update
               : std::is_lt(order) ? Action::Downgrade
                                   : Action::Reinstall;
      const bool mends = application->isDamaged && std::is_eq(order);
      if (std::is_lteq(order) && !named && !mends) {
        return skip(package.identifier,
                    versionText(current) + (application->isDamaged ? InstalledInPart : Installed),
                    !application->isDamaged);
      }
    }
    if (!options_.installingAllowed) {
      return refuse(package.identifier, InstallingForbidden, named);
    }
    plan_.entries.push_back({action, package.identifier, package.version, current, package.name,
                             application && application->waits, named});
  }

  const Library& library_;
  const PlanOptions& options_;
  const std::set<std::string, std::less<>> wanted_;
  const std::set<std::string, std::less<>> unwanted_;
  std::map<std::string, InstalledApplication, std::less<>> installed_;
  SyncPlan plan_;
};

}  // namespace

std::string_view name(Action action) {
  switch (action) {
    case Action::Install:
      return "install";
    case Action::Update:
      return "update";
    case Action::Reinstall:
      return "reinstall";
    case Action::Downgrade:
      return "downgrade";
    case Action::Remove:
      return "remove";
  }
  return "install";
}

std::optional<SyncPlan> makePlan(const Library& library,
                                 const std::vector<InstalledApplication>& installed,
                                 const PlanOptions& options, std::string& problem) {
  Planner planner(library, installed, options);
  if (auto contradiction = planner.contradiction()) {
    problem = std::move(*contradiction);
    return std::nullopt;
  }
  return planner.plan();
}

}  // namespace appsync::host
