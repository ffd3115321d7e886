#pragma once

#include "base/data_stream.h"
#include "device/state/device_core.h"
#include "phone/phone.h"

namespace appsync::device {

// An application's own data on its way into a backup and back. See EmbeddedDevice; the identifier
// is usable.

[[nodiscard]] bool saveApplicationData(DeviceCore& core, std::string_view identifier,
                                       const DataSink& sink, std::optional<Error>* error);
// The device is open for writing.

[[nodiscard]] bool restoreApplicationData(DeviceCore& core, std::string_view identifier,
                                          const DataSource& source, std::optional<Error>* error);
[[nodiscard]] bool overwriteApplicationData(DeviceCore& core, std::string_view identifier,
                                            const DataSource& source, std::optional<Error>* error);

}  // namespace appsync::device
