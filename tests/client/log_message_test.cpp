#include "client/log_message.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <limits>

#include "tests/fakes/fake_log.h"

namespace appsync {
namespace {

/// A literal that a template can be asked about.
template <std::size_t Size>
struct Literal {
  // NOLINTNEXTLINE(google-explicit-constructor): written as a plain literal.
  consteval Literal(const char (&from)[Size]) { std::ranges::copy(from, text); }
  char text[Size] = {};
};

/// Whether a message with this format and such arguments compiles.
template <Literal Format, typename... Args>
concept Compiles = requires {
  typename std::bool_constant<(CheckedLogFormat<Args...>(Format.text), true)>;
};

static_assert(Compiles<"nothing to fill in">);
static_assert(Compiles<"">);
static_assert(Compiles<"%{public}@ and %{public}@", std::string, PropertyList>);

// As many arguments as conversions.
static_assert(!Compiles<"%d">);
static_assert(!Compiles<"%d and %d", int>);
static_assert(!Compiles<"%d", int, int>);
static_assert(!Compiles<"nothing to fill in", std::string>);

// No conversion but the known ones, and none cut off.
static_assert(!Compiles<"%x", int>);
static_assert(!Compiles<"%i", int>);
static_assert(!Compiles<"%@", std::string>);
static_assert(!Compiles<"%{private}@", std::string>);
static_assert(!Compiles<"%{public}", std::string>);
static_assert(!Compiles<"100%">);
static_assert(!Compiles<"%%">);

// Each conversion takes its own kind of argument and no other.
template <Literal Format, bool Boolean, bool Signed, bool Unsigned, bool Real, bool Text,
          bool Object>
constexpr bool takesExactly =
    Compiles<Format, bool> == Boolean&& Compiles<Format, std::int32_t> ==
    Signed&& Compiles<Format, std::int64_t> == Signed&& Compiles<Format, std::uint32_t> ==
    Unsigned&& Compiles<Format, std::uint64_t> == Unsigned&& Compiles<Format, double> ==
    Real&& Compiles<Format, std::string> == Text&& Compiles<Format, std::string_view> ==
    Text&& Compiles<Format, char[4]> == Text&& Compiles<Format, std::optional<std::string>> ==
    Object&& Compiles<Format, Error> == Object&& Compiles<Format, std::set<std::string>> == Object;

static_assert(takesExactly<"%{public}@", false, false, false, false, true, true>);
static_assert(takesExactly<"%c", true, false, false, false, false, false>);
static_assert(takesExactly<"%d", true, true, false, false, false, false>);
static_assert(takesExactly<"%ld", false, true, false, false, false, false>);
static_assert(takesExactly<"%lld", false, true, false, false, false, false>);
static_assert(takesExactly<"%lu", false, false, true, false, false, false>);
static_assert(takesExactly<"%llu", false, false, true, false, false, false>);
static_assert(takesExactly<"%f", false, false, false, true, false, false>);
static_assert(takesExactly<"%lf", false, false, false, true, false, false>);
static_assert(takesExactly<"%s", false, false, false, false, true, false>);

TEST(LogMessage, PrintsBooleansAsLettersOrNumbers) {
  EXPECT_EQ(logMessage("%c %c", true, false), "y n");
  EXPECT_EQ(logMessage("%d %d", true, false), "1 0");
}

TEST(LogMessage, PrintsWholeNumbersOverTheirFullRange) {
  EXPECT_EQ(logMessage("%d", std::int32_t{-7}), "-7");
  EXPECT_EQ(logMessage("%ld", std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
  EXPECT_EQ(logMessage("%lld", std::numeric_limits<std::int64_t>::max()), "9223372036854775807");
  EXPECT_EQ(logMessage("%lu", std::size_t{3}), "3");
  EXPECT_EQ(logMessage("%llu", std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
}

TEST(LogMessage, PrintsRealNumbersWithSixPlaces) {
  EXPECT_EQ(logMessage("%f", 0.5), "0.500000");
  EXPECT_EQ(logMessage("%lf", 1.0), "1.000000");
}

TEST(LogMessage, PrintsText) {
  EXPECT_EQ(logMessage("%s", "literal"), "literal");
  EXPECT_EQ(logMessage("%{public}@", std::string("owned")), "owned");
  EXPECT_EQ(logMessage("%{public}@", std::string_view("borrowed")), "borrowed");
}

TEST(LogMessage, NeverReadsAnArgumentAsAFormat) {
  EXPECT_EQ(logMessage("%{public}@!", std::string("%d %{public}@ %s")), "%d %{public}@ %s!");
}

TEST(LogMessage, KeepsTheTextAroundConversions) {
  EXPECT_EQ(logMessage("a %d%d b%{public}@", 1, 2, "c"), "a 12 bc");
  EXPECT_EQ(logMessage("nothing"), "nothing");
  EXPECT_EQ(logMessage(""), "");
}

TEST(LogMessage, PrintsNothingAtAllAsNull) {
  EXPECT_EQ(logMessage("%{public}@", std::optional<std::string>()), "(null)");
  EXPECT_EQ(logMessage("%{public}@", std::optional<Error>()), "(null)");
  EXPECT_EQ(logMessage("%{public}@", std::optional<PropertyList::Array>()), "(null)");
  EXPECT_EQ(logMessage("%{public}@", PropertyList::null()), "(null)");
  EXPECT_EQ(logMessage("%{public}@", std::shared_ptr<InstallProgress>()), "(null)");
}

TEST(LogMessage, PrintsListsAndSets) {
  EXPECT_EQ(logMessage("%{public}@", std::vector<std::string>{"b", "a"}), "(b, a)");
  EXPECT_EQ(logMessage("%{public}@", std::set<std::string>{"b", "a"}), "(a, b)");
  EXPECT_EQ(logMessage("%{public}@", std::set<std::string>{}), "()");
  EXPECT_EQ(logMessage("%{public}@", std::optional(std::vector<std::string>{"a"})), "(a)");
}

TEST(LogMessage, PrintsObjectsAsTheyDescribeThemselves) {
  AppRecord record;
  record.applicationIdentifier = "com.a";
  AppRecord placeholder = record;
  placeholder.isPlaceholder = true;
  SyncAsset asset;
  asset.identifier = "com.b";
  EXPECT_EQ(logMessage("%{public}@", std::vector<AppRecord>{record, placeholder}),
            "(com.a, com.a (placeholder))");
  EXPECT_EQ(logMessage("%{public}@", asset), "com.b");
  EXPECT_EQ(logMessage("%{public}@", FileLocation::directory("/tmp/a.app")), "/tmp/a.app");
  EXPECT_EQ(logMessage("%{public}@", Error{"TWError", 30, {}, nullptr}),
            "Error Domain=TWError Code=30");
  EXPECT_EQ(logMessage("%{public}@", PropertyList::Dictionary{{"k", PropertyList::Array{1, "b"}}}),
            "{k = (1, b)}");
}

class ClientLogTest : public testing::Test {
 protected:
  fakes::CallTrace trace;
  fakes::FakeLog sink{trace};
  ClientLog log{sink, "com.plugin"};
};

TEST_F(ClientLogTest, PutsThePluginInFrontAndUsesTheRightChannelAndLevel) {
  log.normal("a line of %d", 1);
  log.error("an error of %{public}@", "com.a");
  log.write(LogLevel::Debug, "100% as it stands");
  log.oversize("a list %{public}@", std::vector<std::string>{"a", "b"});
  log.frameworkError("without %s", "prefix");

  const std::vector<fakes::FakeLog::Line> expected{
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Default, "com.plugin|a line of 1"},
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Error, "com.plugin|an error of com.a"},
      {LogChannel::TWLogCategorySyncBundle, LogLevel::Debug, "com.plugin|100% as it stands"},
      {LogChannel::TWLogCategorySyncBundle_Oversize, LogLevel::Default, "com.plugin|a list (a, b)"},
      {LogChannel::TWLogCategoryFramework, LogLevel::Error, "without prefix"}};
  EXPECT_EQ(sink.lines(), expected);
}

}  // namespace
}  // namespace appsync
