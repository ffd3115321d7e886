#pragma once

#include <string>
#include <string_view>

#include "platform/bytes.h"
#include "platform/property_list.h"

namespace appsync::device {

/// Builds an application package, a tar archive, for tests of what happens to packages.
class PackageArchive {
 public:
  PackageArchive& add(std::string_view name, std::string_view contents);
  /// "Sample.app" with the information dictionary of this application.
  PackageArchive& addApplication(std::string_view identifier, std::string_view version);
  PackageArchive& addApplication(const PropertyList::Dictionary& info);
  Bytes bytes() const;

 private:
  std::string entries_;
};

PropertyList::Dictionary infoOf(std::string_view identifier, std::string_view version);
std::string xml(const PropertyList& value);

}  // namespace appsync::device
