// One platform call after another refuses while a restore is prepared.

#include "tests/coordination/restore_trace.h"

namespace appsync::fakes {
namespace {

/// Beginning at this line of a run without faults, the whole trace is another.
struct FaultCase {
  const char* name;
  const char* operation;
  unsigned call;
  const char* firstLineLost;
  Trace instead;
};

void PrintTo(const FaultCase& fault, std::ostream* out) { *out << fault.operation; }

const std::string RefusedText = "Error Domain=Fault Code=7";

/// Ends of the placeholder's making that leave none.
const FaultCase PlaceholderFaults[] = {
    {"WithoutADirectoryThereIsNoPlaceholder",
     "FileManager.createDirectory",
     1,
     "FileManager.createDirectory",
     {"fault FileManager.createDirectory(/tmp/com.corvane.twc.Apps/com.r.app)",
      R"(transaction scenario "Halvo App Restore" failed com.r "Failed to create app directory")",
      said("Created app directory for 'com.r' at /tmp/com.corvane.twc.Apps/com.r.app with "
           "err=Error Domain=Fault Code=7")}},
    {"ARefusedPlaceholderLeavesNothing",
     "InstallCoordination.createAppPlaceholder",
     1,
     "InstallCoordination.createAppPlaceholder",
     {"fault InstallCoordination.createAppPlaceholder(com.r)", "Created placeholder",
      R"(transaction step 4 party 1 phase 2 failed com.r "Finished creating placeholder")"}},
    {"WithoutAnIconPromiseThePlaceholderIsCancelled",
     "InstallCoordination.createPathTransferPromise",
     1,
     "InstallCoordination.createPathTransferPromise",
     {"fault InstallCoordination.createPathTransferPromise(com.r-Icon)",
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
    {"ARefusedIconPromiseIsCancelledWithThePlaceholder",
     "InstallPlaceholder.setIconPromise",
     1,
     "InstallPlaceholder.setIconPromise",
     {"fault InstallPlaceholder.setIconPromise(com.r)",
      complained("Error Error Domain=Fault Code=7 adding icon promise to placeholder for 'com.r'"),
      "DataPromise.cancel(com.r-Icon, Error Domain=TWError Code=29, 3)",
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
    {"RefusedAttributesCancelThePlaceholder",
     "InstallPlaceholder.setPlaceholderAttributes",
     1,
     "InstallPlaceholder.setPlaceholderAttributes",
     {"fault InstallPlaceholder.setPlaceholderAttributes(com.r)",
      complained("Error Error Domain=Fault Code=7 setting placeholder attributes for 'com.r'"),
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
    {"RefusedMetadataCancelThePlaceholder",
     "InstallPlaceholder.setMetadata",
     1,
     "InstallPlaceholder.setMetadata",
     {"fault InstallPlaceholder.setMetadata(com.r)",
      complained("Error Error Domain=Fault Code=7 setting store metadata for 'com.r'"),
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
    {"ARefusedBlobCancelsThePlaceholder",
     "InstallPlaceholder.setSinfData",
     1,
     "InstallPlaceholder.setSinfData",
     {"fault InstallPlaceholder.setSinfData(com.r)",
      complained("Error Error Domain=Fault Code=7 setting SINF data for 'com.r'"),
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
    {"ARefusedCompletionCancelsThePlaceholder",
     "InstallPlaceholder.setConfigurationComplete",
     1,
     "InstallPlaceholder.setConfigurationComplete",
     {"fault InstallPlaceholder.setConfigurationComplete(com.r)",
      complained("Error Error Domain=Fault Code=7 setting placeholder configuration as complete "
                 "for 'com.r'"),
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"}},
};

/// The line whose install type depends on the sort of restore.
Trace withType(Trace lines, const std::string& type) {
  for (std::string& line : lines) {
    if (line == "Created placeholder") {
      line = said("Created placeholder (null) for 'com.r' of type " + type);
    }
  }
  return lines;
}

class RestorePlaceholderFaultTest : public RestoreTest,
                                    public testing::WithParamInterface<FaultCase> {};

TEST_P(RestorePlaceholderFaultTest, CancelsTheRestore) {
  const FaultCase& fault = GetParam();
  phone.faults.failCall(fault.operation, fault.call, Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(), joined({upTo(restored(), fault.firstLineLost), withType(fault.instead, "2"),
                               restoreEnded(false, "(null)"), restoreCoordinatorCancelled()}));
}

TEST_P(RestorePlaceholderFaultTest, CancelsTheRestoreOfADemotedApplication) {
  const FaultCase& fault = GetParam();
  phone.faults.failCall(fault.operation, fault.call, Refused);
  EXPECT_FALSE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(),
            joined({upTo(restoredDemoted(), fault.firstLineLost), withType(fault.instead, "7"),
                    demotedRestoreEnded(false, "(null)"), restoreCoordinatorCancelled()}));
}

INSTANTIATE_TEST_SUITE_P(OneRefusal, RestorePlaceholderFaultTest,
                         testing::ValuesIn(PlaceholderFaults),
                         [](const auto& given) { return std::string(given.param.name); });

const std::string IconPath = "/tmp/com.corvane.twc.Apps/com.r.app/Icon.png";

/// What is left of an icon whose file fails.
struct IconFault {
  const char* name;
  const char* operation;
  Trace lines;
};

void PrintTo(const IconFault& fault, std::ostream* out) { *out << fault.operation; }

const IconFault IconFaults[] = {
    {"ThatCannotBeWritten",
     "FileManager.createFile",
     {"fault FileManager.createFile(" + IconPath + ")",
      said("icon data for 'com.r' was writen to " + IconPath + " with status:0 fileSize:0")}},
    {"OfUnknownSize",
     "FileManager.attributesOfItem",
     {"FileManager.createFile(" + IconPath + ", mobile:mobile)",
      "fault FileManager.attributesOfItem(" + IconPath + ")",
      said("icon data for 'com.r' was writen to " + IconPath + " with status:1 fileSize:0")}},
};

/// The good run with these lines for the icon's file, and without the five of its promise.
Trace withIconLines(const Trace& calm, const Trace& lines) {
  return joined({upTo(calm, "FileManager.createFile"), lines,
                 without(onwards(calm, "transaction step 4 party 1 phase 1"),
                         "InstallCoordination.createPathTransferPromise", 5)});
}

class RestoredIconTest : public RestoreTest, public testing::WithParamInterface<IconFault> {
 protected:
  RestoredIconTest() { phone.faults.failCall(GetParam().operation, 1, Refused); }
};

TEST_P(RestoredIconTest, IsDoneWithout) {
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), withIconLines(restored(), GetParam().lines));
}

TEST_P(RestoredIconTest, OfADemotedApplicationIsDoneWithout) {
  EXPECT_TRUE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(), withIconLines(restoredDemoted(), GetParam().lines));
}

INSTANTIATE_TEST_SUITE_P(OneRefusal, RestoredIconTest, testing::ValuesIn(IconFaults),
                         [](const auto& given) { return std::string(given.param.name); });

using RestoreFaultTest = RestoreTest;

TEST_F(RestoreFaultTest, RefusedMetadataCancelThePlaceholderAlsoWithoutABlob) {
  sinf = std::nullopt;
  phone.faults.failEvery("InstallPlaceholder.setMetadata", Refused);
  const Trace refused = {
      "fault InstallPlaceholder.setMetadata(com.r)",
      complained("Error Error Domain=Fault Code=7 setting store metadata for 'com.r'"),
      "InstallPlaceholder.cancel(com.r, Error Domain=TWError Code=29, 3)"};
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(),
            joined({restoreBegun(),
                    {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)"},
                    promisedUserData(),
                    {"InstallCoordinator.setInstallOptions(com.r, type 2 target 1 metadata "
                     "{bundleVersion = 3; title = Rho})",
                     said("added install options for com.r")},
                    upTo(restoredPlaceholder("2"), "InstallPlaceholder.setMetadata"),
                    refused,
                    restoreEnded(false, "(null)"),
                    restoreCoordinatorCancelled()}));
  forget();
  EXPECT_FALSE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(),
            joined({upTo(restoredDemoted(), "InstallPlaceholder.setMetadata"), refused,
                    demotedRestoreEnded(false, "(null)"), restoreCoordinatorCancelled()}));
}

TEST_F(RestoreFaultTest, MetadataThatDoNotParseEndIt) {
  metadata = toBytes("no property list");
  std::optional<Error> error;
  ASSERT_FALSE(parsePropertyList(metadata, &error));
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(), joined({restoreBegun(),
                               {complained("failed to parse halvo metadata for 'com.r'. err=" +
                                           description(*error))},
                               restoreEnded(false, description(*error))}));
  forget();
  EXPECT_FALSE(restore(DemotionStatus::Intentional));
  EXPECT_EQ(effects(), joined({demotedRestoreBegun(),
                               {complained("failed to parse halvo metadata for 'com.r'. err=" +
                                           description(*error))},
                               demotedRestoreEnded(false, description(*error))}));
}

TEST_F(RestoreFaultTest, MetadataThatAreNoDictionaryEndIt) {
  metadata = plistBytes(PropertyList::Array{"title"});
  EXPECT_FALSE(restore());
  EXPECT_EQ(phone.installCoordination.coordinatorCount(), 0u);
}

TEST_F(RestoreFaultTest, WithoutACoordinatorTheInstallOptionsFailToo) {
  phone.faults.failEvery("InstallCoordination.coordinatorFor", Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(),
            joined({restoreBegun(),
                    {"fault InstallCoordination.coordinatorFor(com.r)",
                     complained("Error 'Error Domain=Fault Code=7' creating restore coordinator "
                                "for com.r"),
                     complained("Error Error Domain=Fault Code=7 setting install options for "
                                "'com.r'")},
                    restoreEnded(false, RefusedText)}));
}

TEST_F(RestoreFaultTest, WithoutACoordinatorADemotedRestoreEndsWithoutAReason) {
  phone.faults.failEvery("InstallCoordination.coordinatorFor", Refused);
  EXPECT_FALSE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(), joined({demotedRestoreBegun(),
                               {"fault InstallCoordination.coordinatorFor(com.r)"},
                               demotedRestoreEnded(false, "(null)")}));
}

Trace userDataRefused() {
  return joined({upTo(promisedUserData(), "InstallCoordinator.setUserDataPromise"),
                 {"fault InstallCoordinator.setUserDataPromise(com.r)",
                  complained("Error Error Domain=Fault Code=7 adding out of band data promise for "
                             "'com.r'")}});
}

TEST_F(RestoreFaultTest, OptionsThatCanBeSetMakeUpForRefusedUserData) {
  phone.faults.failEvery("InstallCoordinator.setUserDataPromise", Refused);
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), joined({restoreBegun(),
                               {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)"},
                               userDataRefused(),
                               restoreOptionsSet(),
                               restoredPlaceholder("2"),
                               packageLeftToStore(),
                               restoreEnded(true, RefusedText)}));
}

TEST_F(RestoreFaultTest, OptionsThatWereThereDoNotMakeUpForRefusedUserData) {
  seed()->edit([](auto& state) { state.options.emplace(); });
  phone.faults.failEvery("InstallCoordinator.setUserDataPromise", Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(), joined({restoreBegun(),
                               {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)"},
                               userDataRefused(),
                               {said("Coordinator for com.r has a valid install options")},
                               restoreEnded(false, RefusedText),
                               restoreCoordinatorCancelled()}));
}

TEST_F(RestoreFaultTest, RefusedUserDataEndTheRestoreOfADemotedApplication) {
  phone.faults.failEvery("InstallCoordinator.setUserDataPromise", Refused);
  EXPECT_FALSE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(),
            joined({demotedRestoreBegun(),
                    {"InstallCoordination.coordinatorFor(com.r, restoring demoted, 3, create)"},
                    userDataRefused(),
                    demotedRestoreEnded(false, RefusedText),
                    restoreCoordinatorCancelled()}));
}

TEST_F(RestoreFaultTest, UserDataThatCannotBePromisedAreDoneWithout) {
  phone.faults.failEvery("InstallCoordination.createOutOfBandTransferPromise", Refused);
  const Trace refused = {
      "fault InstallCoordination.createOutOfBandTransferPromise(com.r-UserData)"};
  EXPECT_TRUE(restore());
  EXPECT_EQ(effects(), joined({restoreBegun(),
                               {"InstallCoordination.coordinatorFor(com.r, restoring, 3, create)"},
                               refused,
                               restoreOptionsSet(),
                               restoredPlaceholder("2"),
                               packageLeftToStore(),
                               restoreEnded(true, "(null)")}));
}

TEST_F(RestoreFaultTest, RefusedInstallOptionsCancelTheCoordinator) {
  phone.faults.failEvery("InstallCoordinator.setInstallOptions", Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(),
            joined({upTo(restored(), "InstallCoordinator.setInstallOptions"),
                    {"fault InstallCoordinator.setInstallOptions(com.r)",
                     complained("Error Error Domain=Fault Code=7 setting install options for "
                                "'com.r'")},
                    restoreEnded(false, RefusedText),
                    restoreCoordinatorCancelled()}));
}

Trace placeholderPromiseRefused() {
  return {"fault InstallCoordinator.setPlaceholderPromise(com.r)",
          complained("Error Error Domain=Fault Code=7 setting placeholder promise for 'com.r'")};
}

TEST_F(RestoreFaultTest, ARefusedPlaceholderIsCancelledAfterTheCoordinator) {
  phone.faults.failEvery("InstallCoordinator.setPlaceholderPromise", Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(effects(), joined({upTo(restored(), "InstallCoordinator.setPlaceholderPromise"),
                               placeholderPromiseRefused(), restoreEnded(false, RefusedText),
                               restoreCoordinatorCancelled(), restorePlaceholderCancelled()}));
}

TEST_F(RestoreFaultTest, ARefusedPlaceholderOfADemotedApplicationIsCancelledLikewise) {
  phone.faults.failEvery("InstallCoordinator.setPlaceholderPromise", Refused);
  EXPECT_FALSE(restore(DemotionStatus::Automatic));
  EXPECT_EQ(effects(), joined({upTo(restoredDemoted(), "InstallCoordinator.setPlaceholderPromise"),
                               placeholderPromiseRefused(), demotedRestoreEnded(false, RefusedText),
                               restoreCoordinatorCancelled(), restorePlaceholderCancelled()}));
}

TEST_F(RestoreFaultTest, APackageThatCannotBeLeftToTheStoreCancelsTheCoordinator) {
  phone.faults.failEvery("InstallCoordinator.setAppAssetPromiseResponsibleClient", Refused);
  EXPECT_FALSE(restore());
  EXPECT_EQ(
      effects(),
      joined({upTo(restored(), "InstallCoordinator.setAppAssetPromiseResponsibleClient"),
              {"fault InstallCoordinator.setAppAssetPromiseResponsibleClient(com.r)",
               complained("Error Error Domain=Fault Code=7 setting KQClientKiosk to satisfy app "
                          "data promise for 'com.r'")},
              restoreEnded(false, RefusedText),
              restoreCoordinatorCancelled()}));
}

}  // namespace
}  // namespace appsync::fakes
