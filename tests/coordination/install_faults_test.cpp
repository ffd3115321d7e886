// One platform call after another refuses while an install is prepared.

#include <algorithm>
#include <cerrno>
#include <iterator>

#include "tests/coordination/install_trace.h"

namespace appsync::fakes {
namespace {

/// Beginning at this line of a run without faults, the whole trace is another.
struct FaultCase {
  const char* name;
  const char* operation;
  unsigned call;
  const char* firstLineLost;
  bool prepared;
  Trace instead;
};

void PrintTo(const FaultCase& fault, std::ostream* out) { *out << fault.operation; }

/// The placeholder is handed over all the same and refused, since nobody might ever finish it.
Trace refusedUnfinished() {
  const std::string error = description(Error::posix(EINVAL));
  return joined(
      {{"InstallCoordinator.setPlaceholderPromise(com.a, <Placeholder com.a>)",
        complained("Error " + error + " adding placeholder promise to coordinator for 'com.a'")},
       installGivenUp(error),
       {said("Cancelling placeholder for appBundleIdentifier:com.a"),
        "InstallPlaceholder.cancel(com.a, Error Domain=TWError Code=1, 3)"},
       installCoordinatorCancelled()});
}

/// The good run's lines from the placeholder on, without the five of the icon's promise.
const Trace PlaceholderWithoutIcon =
    without(onwards(preparedInstall(), "transaction step 4 party 1 phase 1"),
            "InstallCoordination.createPathTransferPromise", 5);

const FaultCase FaultCases[] = {
    {"ARefusedCoordinatorEndsItWithNothingToCancel", "InstallCoordination.coordinatorFor", 1,
     "InstallCoordination.coordinatorFor", false,
     joined({{"fault InstallCoordination.coordinatorFor(com.a)",
              R"(transaction step 3 party 1 phase 2 failed com.a "Finished creating coordinator")"},
             installGivenUp("Error Domain=Fault Code=7")})},
    {"RefusedInstallOptionsCancelTheCoordinator", "InstallCoordinator.setInstallOptions", 1,
     "InstallCoordinator.setInstallOptions", false,
     joined({{"fault InstallCoordinator.setInstallOptions(com.a)",
              complained("Error Error Domain=Fault Code=7 setting install options on coordinator "
                         "for 'com.a'")},
             installGivenUp("Error Domain=Fault Code=7"),
             installCoordinatorCancelled()})},
    {"RefusedInitialPromisesCancelTheCoordinator", "InstallCoordinator.setInitialQPKAssetPromises",
     1, "InstallCoordinator.setInitialQPKAssetPromises", false,
     joined({{"fault InstallCoordinator.setInitialQPKAssetPromises(com.a)",
              complained("Error Error Domain=Fault Code=7 setting QPK asset promise for 'com.a'")},
             installGivenUp("Error Domain=Fault Code=7"),
             installCoordinatorCancelled()})},
    {"AMissingAssetPromiseCancelsTheCoordinator", "InstallCoordination.createPathTransferPromise",
     1, "InstallCoordination.createPathTransferPromise(com.a-Asset", false,
     joined({{"fault InstallCoordination.createPathTransferPromise(com.a-Asset)",
              complained("Error creating asset promise for 'com.a'")},
             installGivenUp("(null)"),
             installCoordinatorCancelled()})},
    {"ARefusedAssetPromiseIsCancelledWithTheCoordinator", "InstallCoordinator.setAppAssetPromise",
     1, "InstallCoordinator.setAppAssetPromise", false,
     joined({{"fault InstallCoordinator.setAppAssetPromise(com.a)",
              complained(
                  "Error Error Domain=Fault Code=7 adding app asset promise at (null) to 'com.a'"),
              complained("Cancelling asset promise for 'com.a'"),
              "DataPromise.cancel(com.a-Asset, Error Domain=TWError Code=30, 3)"},
             installGivenUp("(null)"),
             installCoordinatorCancelled()})},
    {"AMissingDirectoryOnlyCostsTheIcon", "FileManager.createDirectory", 1,
     "FileManager.createDirectory", true,
     joined({{"fault FileManager.createDirectory(/tmp/com.corvane.twc.Apps/com.a.app)",
              R"(transaction scenario "Halvo App Restore" failed com.a )"
              R"("Failed to create app directory")",
              said("Created app directory for 'com.a' at /tmp/com.corvane.twc.Apps/com.a.app with "
                   "err=Error Domain=Fault Code=7")},
             PlaceholderWithoutIcon})},
    {"AnIconThatCannotBeCopiedIsDoneWithout", "FileManager.copyItem", 1, "FileManager.copyItem",
     true,
     joined(
         {{"fault FileManager.copyItem(/icons/com.a.png)",
           said("Copied icon from /icons/com.a.png to "
                "/tmp/com.corvane.twc.Apps/com.a.app/Icon.png with error Error Domain=Fault Code=7"
                " for 'com.a', sizeOnDisk:0"),
           R"(transaction step 5 party 1 phase 2 ok com.a "Copying icon")"},
          PlaceholderWithoutIcon})},
    {"AnIconOfUnknownSizeIsNotPromised", "FileManager.attributesOfItem", 1,
     "log default SyncBundle|icon for com.a", true,
     joined({{"fault FileManager.attributesOfItem(/tmp/com.corvane.twc.Apps/com.a.app/Icon.png)",
              said("icon for com.a at /tmp/com.corvane.twc.Apps/com.a.app/Icon.png has a size of "
                   "0"),
              said("Copied icon from /icons/com.a.png to "
                   "/tmp/com.corvane.twc.Apps/com.a.app/Icon.png with error (null) for 'com.a', "
                   "sizeOnDisk:0"),
              R"(transaction step 5 party 1 phase 2 ok com.a "Copying icon")"},
             PlaceholderWithoutIcon})},
    {"WithoutAPlaceholderNoneIsHandedOverAndThatIsRefused",
     "InstallCoordination.createAppPlaceholder", 1, "InstallCoordination.createAppPlaceholder",
     false,
     joined({{"fault InstallCoordination.createAppPlaceholder(com.a)",
              said("Created placeholder (null) for 'com.a' of type 4"),
              R"(transaction step 4 party 1 phase 2 failed com.a "Finished creating placeholder")",
              "InstallCoordinator.setPlaceholderPromise(com.a, none)",
              complained("Error " + description(Error::posix(22)) +
                         " adding placeholder promise to coordinator for 'com.a'")},
             installGivenUp(description(Error::posix(22))),
             installCoordinatorCancelled()})},
    {"WithoutAnIconPromiseThePlaceholderGoesUnconfigured",
     "InstallCoordination.createPathTransferPromise", 2,
     "InstallCoordination.createPathTransferPromise(com.a-Icon", false,
     joined({{"fault InstallCoordination.createPathTransferPromise(com.a-Icon)"},
             refusedUnfinished()})},
    {"ARefusedIconPromiseIsCancelledAndThePlaceholderGoesUnconfigured",
     "InstallPlaceholder.setIconPromise", 1, "InstallPlaceholder.setIconPromise", false,
     joined({{"fault InstallPlaceholder.setIconPromise(com.a)",
              complained(
                  "Error Error Domain=Fault Code=7 adding icon promise to placeholder for 'com.a'"),
              "DataPromise.cancel(com.a-Icon, Error Domain=TWError Code=30, 3)"},
             refusedUnfinished()})},
    {"RefusedAttributesLeaveThePlaceholderUnfinished",
     "InstallPlaceholder.setPlaceholderAttributes", 1,
     "InstallPlaceholder.setPlaceholderAttributes", false,
     joined({{"fault InstallPlaceholder.setPlaceholderAttributes(com.a)",
              complained(
                  "Error Error Domain=Fault Code=7 setting attributes on placeholder for 'com.a'")},
             refusedUnfinished()})},
    {"RefusedMetadataLeaveThePlaceholderUnfinished", "InstallPlaceholder.setMetadata", 1,
     "InstallPlaceholder.setMetadata", false,
     joined({{"fault InstallPlaceholder.setMetadata(com.a)",
              complained("Error Error Domain=Fault Code=7 setting store metadata on placeholder "
                         "for 'com.a'")},
             refusedUnfinished()})},
    {"ARefusedCompletionLeavesThePlaceholderUnfinished",
     "InstallPlaceholder.setConfigurationComplete", 1,
     "InstallPlaceholder.setConfigurationComplete", false,
     joined({{"fault InstallPlaceholder.setConfigurationComplete(com.a)",
              complained("Error Error Domain=Fault Code=7"
                         " setting placeholder configuration as complete for 'com.a'")},
             refusedUnfinished()})},
    {"ARefusedPlaceholderIsCancelledBeforeTheCoordinator",
     "InstallCoordinator.setPlaceholderPromise", 1, "InstallCoordinator.setPlaceholderPromise",
     false,
     joined({{"fault InstallCoordinator.setPlaceholderPromise(com.a)",
              complained("Error Error Domain=Fault Code=7 adding placeholder promise to "
                         "coordinator for 'com.a'")},
             installGivenUp("Error Domain=Fault Code=7"),
             {said("Cancelling placeholder for appBundleIdentifier:com.a"),
              "InstallPlaceholder.cancel(com.a, Error Domain=TWError Code=1, 3)"},
             installCoordinatorCancelled()})},
};

class InstallFaultTest : public CoordinationTest, public testing::WithParamInterface<FaultCase> {};

TEST_P(InstallFaultTest, LeavesItsWholeTrace) {
  const FaultCase& fault = GetParam();
  const SyncAssetPtr asset = syncedAsset(phone);
  phone.faults.failCall(fault.operation, fault.call, Refused);

  EXPECT_EQ(client->prepareAppForInstallUsingCoordination(asset, false), fault.prepared);

  EXPECT_EQ(effects(), joined({upTo(preparedInstall(), fault.firstLineLost), fault.instead}));
}

TEST_P(InstallFaultTest, LeavesTheSameTraceOfAnUpdate) {
  const FaultCase& fault = GetParam();
  const SyncAssetPtr asset = syncedAsset(phone);
  phone.faults.failCall(fault.operation, fault.call, Refused);

  EXPECT_EQ(client->prepareAppForInstallUsingCoordination(asset, true), fault.prepared);

  EXPECT_EQ(effects(),
            asUpdate(joined({upTo(preparedInstall(), fault.firstLineLost), fault.instead})));
}

/// What a service that does not insist on a configured placeholder takes is prepared.
class LenientServiceTest : public InstallFaultTest {};

TEST_P(LenientServiceTest, DecidesThatAnInstallIsPrepared) {
  const FaultCase& fault = GetParam();
  const SyncAssetPtr asset = syncedAsset(phone);
  phone.installCoordination.takeUnfinishedPlaceholders();
  phone.faults.failCall(fault.operation, fault.call, Refused);

  EXPECT_TRUE(client->prepareAppForInstallUsingCoordination(asset, false));

  constexpr std::string_view handedOver = "InstallCoordinator.setPlaceholderPromise";
  Trace expected =
      joined({upTo(preparedInstall(), fault.firstLineLost), upTo(fault.instead, handedOver),
              onwards(preparedInstall(), handedOver)});
  // Of a placeholder that could not be configured the end tells why.
  if (fault.instead.at(1).find(" setting ") != std::string::npos) {
    std::string& end = expected.at(expected.size() - 2);
    end.replace(end.find("(null)"), 6, "Error Domain=Fault Code=7");
  }
  EXPECT_EQ(effects(), expected);
}

std::vector<FaultCase> unfinishedPlaceholders() {
  std::vector<FaultCase> cases;
  std::ranges::copy_if(FaultCases, std::back_inserter(cases), [](const FaultCase& fault) {
    return !fault.prepared && std::ranges::count(fault.instead, refusedUnfinished().front()) > 0;
  });
  return cases;
}

class OldIconTest : public CoordinationTest, public testing::WithParamInterface<bool> {};

TEST_P(OldIconTest, ThatCannotBeRemovedCostsTheNewOne) {
  const std::string icon = "/tmp/com.corvane.twc.Apps/com.a.app/Icon.png";
  const SyncAssetPtr asset = syncedAsset(phone);
  phone.files.putFile(icon, "an old icon");
  phone.faults.failCall("FileManager.removeItem", 1, Refused);

  EXPECT_TRUE(client->prepareAppForInstallUsingCoordination(asset, GetParam()));

  const Trace install =
      joined({upTo(preparedInstall(), "FileManager.removeItem"),
              {"fault FileManager.removeItem(" + icon + ")",
               "FileManager.copyItem(/icons/com.a.png, " + icon + ")",
               said("Copied icon from /icons/com.a.png to " + icon + " with error " +
                    description(Error::posix(EEXIST, icon)) + " for 'com.a', sizeOnDisk:0"),
               R"(transaction step 5 party 1 phase 2 ok com.a "Copying icon")"},
              PlaceholderWithoutIcon});
  EXPECT_EQ(effects(), GetParam() ? asUpdate(install) : install);
  EXPECT_EQ(phone.files.textAt(icon), "an old icon");
}

INSTANTIATE_TEST_SUITE_P(InstallAndUpdate, OldIconTest, testing::Bool(),
                         [](const auto& given) { return given.param ? "Update" : "Install"; });

INSTANTIATE_TEST_SUITE_P(OneRefusal, LenientServiceTest,
                         testing::ValuesIn(unfinishedPlaceholders()),
                         [](const auto& given) { return std::string(given.param.name); });

INSTANTIATE_TEST_SUITE_P(OneRefusal, InstallFaultTest, testing::ValuesIn(FaultCases),
                         [](const auto& given) { return std::string(given.param.name); });

}  // namespace
}  // namespace appsync::fakes
