#include "bench/bench_phone.h"

#include <archive.h>
#include <archive_entry.h>
#include <stdlib.h>

#include <cstdio>
#include <random>
#include <stdexcept>

#include "icons/image_encoder.h"
#include "platform/property_list_codec.h"

namespace appsync::bench {
namespace {

std::unique_ptr<device::EmbeddedDevice> newDevice(const std::filesystem::path& folder) {
  device::DeviceError error;
  if (!device::EmbeddedDevice::initialize(folder, {}, error))
    throw std::runtime_error(error.message);
  auto made = device::EmbeddedDevice::open(folder, device::Access::Write, error);
  if (!made) throw std::runtime_error(error.message);
  return made;
}

void addFile(archive* writer, const std::string& name, ByteView bytes) {
  archive_entry* entry = archive_entry_new();
  archive_entry_set_pathname(entry, name.c_str());
  archive_entry_set_filetype(entry, AE_IFREG);
  archive_entry_set_perm(entry, 0644);
  archive_entry_set_size(entry, static_cast<la_int64_t>(bytes.size()));
  archive_write_header(writer, entry);
  archive_write_data(writer, bytes.data(), bytes.size());
  archive_entry_free(entry);
}

}  // namespace

TemporaryFolder::TemporaryFolder(const std::filesystem::path& parent) {
  std::string name = (parent / "appsync-bench-XXXXXX").string();
  if (!mkdtemp(name.data())) throw std::runtime_error("no temporary folder");
  path_ = name;
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

BenchPhone::BenchPhone()
    : host_(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption_),
      device_(newDevice(folder_.path() / "phone")),
      platform_(device_->platform(host_)),
      client_(platform_) {}

void BenchPhone::put(const std::string& path, ByteView bytes) {
  const std::string parent = path.substr(0, path.rfind('/'));
  if (!files().createDirectory(parent, true, {}) || !files().createFile(path, bytes, {})) {
    throw std::runtime_error("cannot write " + path);
  }
}

void BenchPhone::putTodoList(std::size_t entries, bool withBundles) {
  const Bytes icon = withBundles ? pngOf(180) : Bytes{};
  PropertyList::Array todo;
  for (std::size_t index = 0; index < entries; ++index) {
    const std::string identifier = identifierOf(index);
    todo.push_back(PropertyList::Dictionary{{"identifier", identifier},
                                            {"operation", "install"},
                                            {"version", "1.0"},
                                            {"name", "Application " + identifier}});
    if (!withBundles) continue;
    const PropertyList::Dictionary info{{std::string(KBBundleIdentifier), identifier},
                                        {std::string(KBBundleDisplayName), "Application"},
                                        {std::string(KBBundleIconFile), "Icon.png"}};
    put(WorkArea + "/" + identifier + "/Info.plist",
        *serializePropertyList(info, PropertyListFormat::Xml));
    put(WorkArea + "/" + identifier + "/Icon.png", icon);
  }
  put(TodoList, *serializePropertyList(std::move(todo), PropertyListFormat::Binary));
}

std::string identifierOf(std::size_t index) { return "org.example.app" + std::to_string(index); }

Bytes pngOf(std::uint32_t side) {
  Image image{side, side, Bytes(std::size_t{side} * side * 4)};
  for (std::uint32_t y = 0; y < side; ++y) {
    for (std::uint32_t x = 0; x < side; ++x) {
      std::byte* pixel = &image.pixels[(std::size_t{y} * side + x) * 4];
      pixel[0] = std::byte(x * 255 / side);
      pixel[1] = std::byte(y * 255 / side);
      pixel[2] = std::byte((x * 7 ^ y * 13) & 0xff);
      pixel[3] = std::byte{255};
    }
  }
  PngEncoderService service;
  Bytes png;
  const std::unique_ptr<ImageEncoder> encoder = service.create(png, "public.png", 1);
  encoder->addImage(image);
  if (!encoder->finalize()) throw std::runtime_error("cannot encode a picture");
  return png;
}

void writePackage(const std::filesystem::path& file, PackageForm form, std::size_t kib) {
  archive* writer = archive_write_new();
  if (form == PackageForm::TarZst) {
    archive_write_set_format_pax_restricted(writer);
    archive_write_add_filter_zstd(writer);
  } else {
    archive_write_set_format_zip(writer);
    if (form == PackageForm::Store) archive_write_zip_set_compression_store(writer);
  }
  if (archive_write_open_filename(writer, file.c_str()) != ARCHIVE_OK) {
    throw std::runtime_error("cannot write " + file.string());
  }
  const PropertyList::Dictionary info{{std::string(KBBundleIdentifier), "org.example.bench"},
                                      {std::string(KBBundleVersion), "1.0"},
                                      {std::string(KBBundleDisplayName), "Bench"}};
  addFile(writer, "Bench.app/Info.plist", *serializePropertyList(info, PropertyListFormat::Xml));
  std::mt19937 random(1);
  Bytes content((form == PackageForm::DeflateLarge ? kib : 64) << 10);
  for (std::size_t done = 0; done < kib << 10; done += content.size()) {
    for (std::byte& byte : content) byte = std::byte(random() & 15);
    addFile(writer, "Bench.app/data/" + std::to_string(done >> 16), content);
  }
  archive_write_close(writer);
  archive_write_free(writer);
}

}  // namespace appsync::bench
