#include <fcntl.h>
#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <system_error>

#include "base/temporary_file.h"
#include "base/text.h"
#include "host/cli/cli.h"
#include "host/home_screen/home_screen_icons.h"
#include "host/home_screen/home_screen_module.h"
#include "icons/image_encoder.h"

namespace appsync::host {
namespace fs = std::filesystem;
namespace {

struct HomeScreenOptions {
  std::string output;
  std::size_t page = 0;  // 0: all
};

std::string counted(std::size_t count, std::string_view what) {
  return fmt::format("{} {}{}", count, what, count == 1 ? "" : "s");
}

ScreenView viewOf(std::size_t pages, std::size_t page) {
  if (page > pages) {
    throw CommandError(
        ExitCode::WrongUsage,
        fmt::format("there is no page {}: the home screen has {}", page, counted(pages, "page")));
  }
  if (page > 0) return {pages, page - 1, 1};
  if (pages > ScreenView::MaximumPages) {
    throw CommandError(
        ExitCode::WrongUsage,
        fmt::format("{} pages are too many for one picture: choose one with --page", pages));
  }
  return {pages, 0, pages};
}

Bytes encode(const Image& image) {
  Bytes file;
  const auto encoder = PngEncoderService().create(file, "public.png", 1);
  if (encoder) encoder->addImage(image);
  if (!encoder || !encoder->finalize()) throw std::runtime_error("the picture cannot be encoded");
  return file;
}

bool replaceFile(int directory, const std::string& name, ByteView bytes) {
  TemporaryFile file(directory);
  return file.isOpen() && writeAll(file.fd(), bytes) && file.takePlaceOf(name, Durability::Durable);
}

/// The file appears whole or not at all; a device or a link to one is left as it is.
void writeFile(const fs::path& path, const Bytes& bytes) {
  std::string reason = "it is no regular file";
  std::error_code failure;
  const fs::file_status status = fs::status(path, failure);
  if (!fs::status_known(status)) {
    reason = failure.message();
  } else if (!fs::exists(status) || fs::is_regular_file(status)) {
    const FileDescriptor folder(
        ::open(path.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (folder && replaceFile(folder.get(), path.filename().string(), bytes)) return;
    reason = systemText(errno);
  }
  throw CommandError(ExitCode::SomeFailed,
                     fmt::format("cannot write {}: {}", printable(path.string()), reason));
}

ExitCode runHomeScreen(const HomeScreenOptions& options, CommandContext& context) {
  const auto device = context.openDevice(device::Access::ReadOnly);
  const auto order = device->homeScreenOrder();
  const ScreenView view = viewOf(pagesFor(order.size()), options.page);
  const HomeScreenIcons source(device->phone(), view.iconSide());
  std::vector<ScreenIcon> icons;
  const std::size_t first = view.firstPage * IconsPerPage;
  const std::size_t end = std::min(first + view.pagesShown * IconsPerPage, order.size());
  for (std::size_t i = first; i < end; ++i) {
    if (auto icon = source.iconOf(order[i])) icons.push_back(std::move(*icon));
  }
  writeFile(fs::absolute(options.output), encode(drawHomeScreenByModule(view, icons)));
  context.say({{"event", "home-screen"},
               {"file", options.output},
               {"pages", view.pagesShown},
               {"icons", icons.size()}},
              fmt::format("{}: {}, {}", printable(options.output), counted(view.pagesShown, "page"),
                          counted(icons.size(), "icon")));
  return ExitCode::Done;
}

std::string checkEnding(const std::string& output) {
  std::string ending = fs::path(output).extension();
  for (char& c : ending) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return ending == ".png" ? "" : "must end in .png";
}

}  // namespace

void addHomeScreenCommand(CLI::App& app, Command& chosen) {
  CLI::App* command = app.add_subcommand("home-screen", "Draw the phone's home screen");
  auto options = std::make_shared<HomeScreenOptions>();
  command->add_option("-o,--output", options->output, "The picture")
      ->required()
      ->check(checkEnding)
      ->type_name("FILE.png");
  command->add_option("--page", options->page, "Only this page, from 1")
      ->check(checkPositive)
      ->type_name("N");
  command->footer(
      "Placeholders are dimmed: a ring fills while the package comes, and stays empty while it is\n"
      "waited for; a cloud says that nobody is bringing it. Works while a sync runs too.\n"
      "Example: appsync --device phone home-screen -o phone.png");
  command->callback([options, &chosen] {
    chosen = [options](CommandContext& context) { return runHomeScreen(*options, context); };
  });
}

}  // namespace appsync::host
