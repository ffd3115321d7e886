#include "device/application_data.h"

#include <cerrno>

namespace appsync::device {

bool saveApplicationData(DeviceCore&, std::string_view identifier, const EmbeddedDevice::DataSink&,
                         std::optional<Error>* error) {
  setError(error, Error::posix(ENOSYS, identifier));
  return false;
}

bool restoreApplicationData(DeviceCore&, std::string_view identifier,
                            const EmbeddedDevice::DataSource&, std::optional<Error>* error) {
  setError(error, Error::posix(ENOSYS, identifier));
  return false;
}

}  // namespace appsync::device
