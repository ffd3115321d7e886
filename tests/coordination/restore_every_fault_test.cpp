// Each call that a restore makes of the phone fails once. Whatever it is, the restore goes on: up
// to there nothing changes, applications that it does not name leave the trace they always leave,
// and the list is used up.

#include <algorithm>

#include "tests/coordination/restore_list.h"

namespace appsync::fakes {
namespace {

const char* const Applications[] = {"com.q", "com.r", "com.s"};

constexpr const char* Demoted = "com.r";

/// A phone that restores three applications, the second of them demoted if any is.
class RestoringPhone : public RestoredBackupTest {
 public:
  explicit RestoringPhone(bool coordinated, bool demotes = true) : RestoredBackupTest(coordinated) {
    if (demotes) {
      phone.files.putPlist(DemotedApps, PropertyList::Dictionary{
                                            {"AutomaticDowngrades", PropertyList::Array{Demoted}}});
    }
    PropertyList::Dictionary list;
    for (const char* identifier : Applications) {
      list.emplace(identifier, entryWith(plainMetadata()));
    }
    putList(std::move(list));
  }

  void TestBody() override {}

  void fail(const std::string& operation, unsigned call) {
    phone.faults.failCall(operation, call, Refused);
  }
  void refuseNotifications() { phone.notifier.setRegistrationStatus(1); }
  /// The whole trace, with what was only asked.
  Trace restore() {
    std::optional<Error> error = Refused;
    EXPECT_TRUE(client->reconcileRestoreOfType(2, &error));
    EXPECT_FALSE(error);
    return phone.trace.readable(TraceAll);
  }
  bool listIsUsedUp() const { return listIsKept(); }
};

std::string operationOf(const std::string& line) {
  const std::size_t end = line.find('(');
  const std::size_t dot = line.find('.');
  if (end == std::string::npos || dot > end || line.find(' ') < end) return {};
  return line.substr(0, end);
}

/// What one application leaves in a trace.
Trace partOf(const Trace& trace, const std::string& identifier) {
  const std::string beginning = said("processing halvo restore info for '" + identifier + "'");
  const std::string other = said("processing halvo restore info for '");
  auto begin = std::find_if(trace.begin(), trace.end(),
                            [&](const std::string& line) { return line.starts_with(beginning); });
  if (begin == trace.end()) return {};
  const auto end = std::find_if(begin + 1, trace.end(), [&](const std::string& line) {
    return line.starts_with(other) ||
           line.find("removeItem(" + std::string(KeptCopy)) != std::string::npos;
  });
  return {begin, end};
}

class EveryRestoreFaultTest : public testing::TestWithParam<bool> {
 protected:
  /// What each application is to leave in the trace, but for the one that the fault itself names.
  Trace expectedPartOf(const std::string& identifier, const std::string& fault) const {
    const std::string list(RestoreList);
    // A list that is not found, or cannot be read, names nobody.
    if (fault == "fault FileManager.attributesOfItem(" + list + ")" ||
        fault == "fault FileManager.contentsAtPath(" + list + ")") {
      return {};
    }
    // Without the list of demotions nobody is demoted.
    const bool unknown =
        fault == "fault FileManager.contentsAtPath(" + std::string(DemotedApps) + ")";
    return partOf(unknown && identifier == Demoted ? nobodyDemoted_ : calm_, identifier);
  }
  /// The sync root and what becomes of the used list concern no application.
  void expectOthersUntouched(const Trace& trace, const std::string& fault) const {
    for (const char* identifier : Applications) {
      if (fault.find(identifier) != std::string::npos) continue;
      EXPECT_EQ(partOf(trace, identifier), expectedPartOf(identifier, fault)) << identifier;
    }
  }

  const Trace calm_ = RestoringPhone(GetParam()).restore();
  const Trace nobodyDemoted_ = RestoringPhone(GetParam(), false).restore();
};

TEST_P(EveryRestoreFaultTest, ConcernsOneApplicationAtMost) {
  std::map<std::string, unsigned> calls;
  unsigned struck = 0;
  for (const std::string& line : calm_) {
    const std::string operation = operationOf(line);
    if (operation.empty()) continue;
    const unsigned call = ++calls[operation];
    SCOPED_TRACE(operation + ", call " + std::to_string(call));
    RestoringPhone phone(GetParam());
    phone.fail(operation, call);
    const Trace trace = phone.restore();

    const Trace before = upTo(trace, "fault ");
    if (before.size() == trace.size()) continue;  // an operation that cannot fail
    ++struck;
    ASSERT_LE(before.size(), calm_.size());
    EXPECT_TRUE(std::equal(before.begin(), before.end(), calm_.begin()));
    const std::string& fault = trace[before.size()];
    expectOthersUntouched(trace, fault);
    const bool notMoved =
        fault.starts_with("fault FileManager.moveItem") ||
        fault == "fault FileManager.attributesOfItem(" + std::string(RestoreList) + ")";
    EXPECT_EQ(phone.listIsUsedUp(), !notMoved);
  }
  EXPECT_GT(struck, GetParam() ? 40u : 20u);
}

TEST_P(EveryRestoreFaultTest, ARefusedNotificationConcernsNoApplication) {
  RestoringPhone phone(GetParam());
  phone.refuseNotifications();
  const std::string next = "FileManager.createDirectory(/var/mobile/Library/ApplicationSync";
  EXPECT_EQ(onwards(phone.restore(), next), onwards(calm_, next));
  EXPECT_TRUE(phone.listIsUsedUp());
}

INSTANTIATE_TEST_SUITE_P(BothModes, EveryRestoreFaultTest, testing::Bool(), [](const auto& given) {
  return given.param ? "Coordinated" : "Uncoordinated";
});

}  // namespace
}  // namespace appsync::fakes
