#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <initializer_list>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "client/apps_client.h"
#include "platform/property_list_codec.h"
#include "tests/fakes/fake_platform.h"

namespace appsync::fakes {

using Trace = std::vector<std::string>;

inline Error errorOf(std::string_view domain, std::int64_t code) {
  Error error;
  error.domain = domain;
  error.code = code;
  return error;
}

/// What a service gives when a planned fault strikes: "Error Domain=Fault Code=7".
inline const Error Refused = errorOf("Fault", 7);
inline Bytes plistBytes(const PropertyList& value) {
  return serializePropertyList(value, PropertyListFormat::Xml).value_or(Bytes{});
}

inline std::string said(std::string_view text) {
  return std::string("log default SyncBundle|").append(text);
}
inline std::string complained(std::string_view text) {
  return std::string("log error SyncBundle|").append(text);
}

/// The lines before the first one that begins with `beginning`; everything when there is none.
inline Trace upTo(const Trace& trace, std::string_view beginning) {
  Trace head;
  for (const std::string& line : trace) {
    if (line.starts_with(beginning)) break;
    head.push_back(line);
  }
  return head;
}

/// The lines from the first one that begins with `beginning`.
inline Trace onwards(const Trace& trace, std::string_view beginning) {
  return {trace.begin() + static_cast<std::ptrdiff_t>(upTo(trace, beginning).size()), trace.end()};
}

/// Leaves out `count` lines, from the first one that begins with `beginning`.
inline Trace without(Trace trace, std::string_view beginning, std::size_t count) {
  const auto first = trace.begin() + static_cast<std::ptrdiff_t>(upTo(trace, beginning).size());
  trace.erase(first, first + static_cast<std::ptrdiff_t>(count));
  return trace;
}

inline Trace joined(std::initializer_list<Trace> parts) {
  Trace whole;
  for (const Trace& part : parts) whole.insert(whole.end(), part.begin(), part.end());
  return whole;
}

/// A client on a phone whose installs are coordinated. The trace begins after its construction.
class CoordinationTest : public testing::Test {
 protected:
  explicit CoordinationTest(bool coordinated = true) {
    phone.installCoordination.setEnabled(coordinated);
    client = std::make_unique<AppsClient>(phone.platform());
    phone.trace.clear();
  }

  Trace effects() const { return phone.trace.readable(TraceEffects); }
  void forget() { phone.trace.clear(); }

  FakePlatform phone;
  std::unique_ptr<AppsClient> client;
};

/// An application "com.a" with everything that a desktop sends of it.
inline SyncAssetPtr syncedAsset(FakePlatform& phone) {
  phone.files.putPlist("/staging/com.a/Info.plist",
                       PropertyList::Dictionary{{"SWApplicationLaunchProhibited", true}});
  phone.files.putPlist("/staging/com.a/HalvoMetadata.plist",
                       PropertyList::Dictionary{{"itemId", 42}});
  phone.files.putFile("/icons/com.a.png", "12345");
  auto asset = std::make_shared<SyncAsset>();
  asset->identifier = "com.a";
  asset->dataclass = "Application";
  asset->prettyName = "Alpha";
  asset->icon = FileLocation::file("/icons/com.a.png");
  asset->variantOptions.emplace(AssetVersionKey, "2.0");
  asset->infoPlist = "/staging/com.a/Info.plist";
  asset->storePlist = "/staging/com.a/HalvoMetadata.plist";
  return asset;
}

}  // namespace appsync::fakes
