#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "host/home_screen/home_screen_picture.h"
#include "host/phone/demotions.h"
#include "phone/phone.h"

namespace appsync::host {

/// What a phone's home screen shows of its applications, also while another process installs some.
class HomeScreenIcons {
 public:
  /// Pictures of icons are `side` pixels wide.
  HomeScreenIcons(const Phone& phone, std::uint32_t side);

  /// As it is now; nullopt for what is not on the phone. The picture is that of the application's
  /// bundle or the artwork beside the bundle; none when neither can be drawn.
  std::optional<ScreenIcon> iconOf(std::string_view identifier) const;

 private:
  struct Records;
  Records recordsOf(std::string_view identifier) const;
  ScreenIcon describe(const Records& records) const;
  std::optional<Image> picture(const AppRecord& record) const;
  std::optional<Image> artwork(const AppRecord& record) const;
  void showProgress(const AppRecord& placeholder, ScreenIcon& icon) const;

  FileManager& files_;
  AppRegistry& registry_;
  const std::uint32_t side_;
  const Demotions demotions_;
};

}  // namespace appsync::host
