#include "device/coordination/coordination_values.h"

#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

constexpr PropertyListFormat Format = PropertyListFormat::Binary;

PropertyList::Dictionary treeOf(const Error& error) {
  PropertyList::Dictionary tree{
      {"Domain", error.domain}, {"Code", error.code}, {"UserInfo", error.userInfo}};
  if (error.underlying) tree.emplace("Underlying", treeOf(*error.underlying));
  return tree;
}

std::optional<Error> errorIn(const PropertyList::Dictionary& tree) {
  const std::string* domain = findString(tree, "Domain");
  const PropertyList* code = find(tree, "Code");
  const PropertyList* info = find(tree, "UserInfo");
  if (!domain || !code || !code->asInteger() || !info || !info->asDictionary()) return std::nullopt;
  Error error{*domain, *code->asInteger(), *info->asDictionary(), nullptr};
  const PropertyList* underlying = find(tree, "Underlying");
  if (underlying && underlying->asDictionary()) {
    if (const auto cause = errorIn(*underlying->asDictionary())) {
      error.underlying = std::make_shared<const Error>(*cause);
    }
  }
  return error;
}

std::optional<PropertyList::Dictionary> dictionaryFrom(const Bytes& bytes) {
  const std::optional<PropertyList> value = parsePropertyList(bytes);
  const PropertyList::Dictionary* dictionary = value ? value->asDictionary() : nullptr;
  return dictionary ? std::optional(*dictionary) : std::nullopt;
}

}  // namespace

Bytes bytesOf(const Error& error) {
  if (const auto bytes = serializePropertyList(treeOf(error), Format)) return *bytes;
  const Error plain =
      Error::withDescription(error.domain, error.code, error.localizedDescription());
  if (const auto bytes = serializePropertyList(treeOf(plain), Format)) return *bytes;
  const Error bare{std::string(POSIXErrorDomain), error.code, {}, nullptr};
  return serializePropertyList(treeOf(bare), Format).value_or(Bytes{});
}

std::optional<Error> errorFrom(const Bytes& bytes) {
  const auto tree = dictionaryFrom(bytes);
  return tree ? errorIn(*tree) : std::nullopt;
}

std::optional<Bytes> bytesOf(const InstallOptions& options, std::optional<Error>* error) {
  PropertyList::Dictionary tree{{"InstallType", static_cast<std::uint64_t>(options.installType)},
                                {"TargetType", options.installTargetType}};
  if (options.storeMetadata) tree.emplace("StoreMetadata", options.storeMetadata->values);
  if (options.sinfData) tree.emplace("Sinf", *options.sinfData);
  return serializePropertyList(std::move(tree), Format, error);
}

std::optional<InstallOptions> optionsFrom(const Bytes& bytes) {
  const auto tree = dictionaryFrom(bytes);
  if (!tree) return std::nullopt;
  const PropertyList* type = find(*tree, "InstallType");
  const PropertyList* target = find(*tree, "TargetType");
  if (!type || !type->asUnsigned() || !target || !target->asUnsigned()) return std::nullopt;
  InstallOptions options;
  options.installType = static_cast<InstallType>(*type->asUnsigned());
  options.installTargetType = *target->asUnsigned();
  const PropertyList* metadata = find(*tree, "StoreMetadata");
  if (metadata && metadata->asDictionary()) {
    options.storeMetadata = StoreMetadata::fromDictionary(*metadata->asDictionary());
  }
  const PropertyList* sinf = find(*tree, "Sinf");
  if (sinf && sinf->asData()) options.sinfData = *sinf->asData();
  return options;
}

std::optional<Bytes> bytesOf(const PlaceholderAttributes& attributes, std::optional<Error>* error) {
  PropertyList::Dictionary tree{{"Info", attributes.infoDictionary},
                                {"LaunchProhibited", attributes.launchProhibited}};
  if (attributes.bundleVersion) tree.emplace("Version", *attributes.bundleVersion);
  return serializePropertyList(std::move(tree), Format, error);
}

std::optional<PlaceholderAttributes> attributesFrom(const Bytes& bytes) {
  const auto tree = dictionaryFrom(bytes);
  const PropertyList* info = tree ? find(*tree, "Info") : nullptr;
  const PropertyList* prohibited = tree ? find(*tree, "LaunchProhibited") : nullptr;
  if (!info || !info->asDictionary() || !prohibited) return std::nullopt;
  PlaceholderAttributes attributes =
      PlaceholderAttributes::fromInfoDictionary(*info->asDictionary());
  attributes.setLaunchProhibited(prohibited->booleanValue());
  if (const std::string* version = findString(*tree, "Version")) {
    attributes.setBundleVersion(*version);
  }
  return attributes;
}

std::optional<Bytes> bytesOf(const StoreMetadata& metadata, std::optional<Error>* error) {
  return serializePropertyList(metadata.values, Format, error);
}

std::optional<StoreMetadata> metadataFrom(const Bytes& bytes) {
  auto tree = dictionaryFrom(bytes);
  if (!tree) return std::nullopt;
  return StoreMetadata::fromDictionary(std::move(*tree));
}

std::optional<Bytes> bytesOf(const std::vector<std::int64_t>& numbers) {
  return serializePropertyList(PropertyList::Array(numbers.begin(), numbers.end()), Format);
}

std::optional<std::vector<std::int64_t>> numbersFrom(const Bytes& bytes) {
  const std::optional<PropertyList> value = parsePropertyList(bytes);
  if (!value || !value->asArray()) return std::nullopt;
  std::vector<std::int64_t> numbers;
  for (const PropertyList& item : *value->asArray()) {
    const std::optional<std::int64_t> number = item.asInteger();
    if (!number) return std::nullopt;
    numbers.push_back(*number);
  }
  return numbers;
}

}  // namespace appsync::device
