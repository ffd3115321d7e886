#include "tests/contract/phone.h"

#include "platform/property_list_codec.h"

namespace appsync::contract {

PropertyList::Dictionary packageOptions(std::string_view identifier) {
  return {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
          {std::string(KBBundleIdentifier), identifier}};
}

void ServiceContract::putFile(std::string_view path, std::string_view text) {
  const std::string_view parent = path.substr(0, path.rfind('/'));
  ASSERT_TRUE(platform.files.createDirectory(parent, true, {}));
  ASSERT_TRUE(platform.files.writeAtomically(path, asBytes(text)));
}

std::optional<std::string> ServiceContract::textAt(std::string_view path) {
  const std::optional<Bytes> bytes = platform.files.contentsAtPath(path);
  if (!bytes) return std::nullopt;
  return std::string(asText(*bytes));
}

std::string ServiceContract::placeholderBundle(std::string_view identifier,
                                               std::string_view version) {
  const std::string bundle =
      joinPath(platform.files.temporaryDirectory(), std::string(identifier) + ".app");
  const PropertyList::Dictionary info = {
      {std::string(KBBundleIdentifier), identifier},
      {std::string(KBBundleVersion), version},
      {std::string(KBBundleDisplayName), "Name of " + std::string(identifier)},
      {std::string(KBBundleExecutable), "Name of " + std::string(identifier)},
      {std::string(KBBundleIconFile), "Icon.png"},
  };
  putFile(joinPath(bundle, "Info.plist"),
          asText(serializePropertyList(info, PropertyListFormat::Xml).value()));
  return bundle;
}

bool ServiceContract::installPlaceholder(std::string_view identifier, std::string_view version,
                                         InstallType type, std::optional<Error>* error) {
  const PropertyList::Dictionary options = {
      {std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
      {std::string(KBBundleIdentifier), identifier},
      {std::string(SWInstallTypeKey), static_cast<std::uint64_t>(type)}};
  return platform.appRegistry.installApplication(
      FileLocation::directory(placeholderBundle(identifier, version)), options, error);
}

bool ServiceContract::installPackage(std::string_view identifier, std::string_view version,
                                     std::optional<Error>* error) {
  const std::string path =
      joinPath(platform.files.temporaryDirectory(), std::string(identifier) + ".package");
  phone->putPackage(path, identifier, version);
  return platform.appRegistry.installApplication(FileLocation::file(path),
                                                 packageOptions(identifier), error);
}

}  // namespace appsync::contract
