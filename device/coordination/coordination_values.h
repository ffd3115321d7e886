#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/install_coordination.h"

namespace appsync::device {

// Values of the coordination service as binary property lists. Those that come from clients may
// hold what no property list can (then nullopt and an error); bytes that are not what was written
// give nullopt.

/// An error whose user info cannot be written keeps its text.
Bytes bytesOf(const Error& error);
std::optional<Error> errorFrom(const Bytes& bytes);

std::optional<Bytes> bytesOf(const InstallOptions& options, std::optional<Error>* error);
std::optional<InstallOptions> optionsFrom(const Bytes& bytes);

std::optional<Bytes> bytesOf(const PlaceholderAttributes& attributes, std::optional<Error>* error);
std::optional<PlaceholderAttributes> attributesFrom(const Bytes& bytes);

std::optional<Bytes> bytesOf(const StoreMetadata& metadata, std::optional<Error>* error);
std::optional<StoreMetadata> metadataFrom(const Bytes& bytes);

std::optional<Bytes> bytesOf(const std::vector<std::int64_t>& numbers);
std::optional<std::vector<std::int64_t>> numbersFrom(const Bytes& bytes);

}  // namespace appsync::device
