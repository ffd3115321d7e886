#include "host/home_screen/home_screen_module.h"

#include <dlfcn.h>

#include <stdexcept>
#include <string>

#include "base/program_parts.h"
#include "base/text.h"

namespace appsync::host {
namespace {

constexpr std::string_view ModuleName = "HomeScreen.so";

[[noreturn]] void failLoading() {
  const char* reason = ::dlerror();
  throw std::runtime_error("cannot load " + std::string(ModuleName) + ": " +
                           printable(reason ? reason : "it draws nothing"));
}

}  // namespace

Image drawHomeScreenByModule(const ScreenView& view, const std::vector<ScreenIcon>& icons) {
  const auto file = findProgramPart(ModuleName);
  if (!file) throw std::runtime_error("there is no " + std::string(ModuleName) + " beside appsync");
  // Never unloaded: the libraries keep what they know until the process ends.
  void* const module = ::dlopen(file->c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!module) failLoading();
  auto* const draw = reinterpret_cast<DrawHomeScreen*>(::dlsym(module, DrawHomeScreenSymbol));
  if (!draw) failLoading();
  Image picture;
  draw(view, icons, picture);
  return picture;
}

}  // namespace appsync::host
