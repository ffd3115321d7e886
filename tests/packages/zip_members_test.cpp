#include "packages/zip_members.h"

#include <gtest/gtest.h>
#include <libdeflate.h>

#include "packages/package_reader.h"
#include "packages/zip_format.h"
#include "tests/packages/package_builder.h"

namespace appsync::package_tests {
namespace {

constexpr std::uint64_t Largest = 1 << 20;

std::string little(std::uint64_t value, std::size_t size) {
  std::string bytes;
  for (; size > 0; --size, value >>= 8) bytes += static_cast<char>(value & 0xff);
  return bytes;
}

std::string deflated(std::string_view text) {
  libdeflate_compressor* compressor = ::libdeflate_alloc_compressor(6);
  std::string bytes(::libdeflate_deflate_compress_bound(compressor, text.size()), '\0');
  bytes.resize(::libdeflate_deflate_compress(compressor, text.data(), text.size(), bytes.data(),
                                             bytes.size()));
  ::libdeflate_free_compressor(compressor);
  return bytes;
}

/// Where the fields of a header that both kinds of it have begin: 4 bytes later in the directory.
enum Field : std::size_t {
  Flags = 6,
  Method = 8,
  Checksum = 14,
  Packed = 18,
  Size = 22,
  Extra = 28
};

/// A zip archive of files, put down as other tools than the archive library do it.
class Zip {
 public:
  explicit Zip(std::uint16_t method = zip::Deflated, std::uint16_t flags = 0)
      : method_(method), flags_(flags) {}

  Zip& add(const std::string& name, const std::string& contents) {
    const std::string packed = method_ == zip::Deflated ? deflated(contents) : contents;
    const std::string sum = little(::libdeflate_crc32(0, contents.data(), contents.size()), 4) +
                            little(packed.size(), 4) + little(contents.size(), 4);
    const bool described = (flags_ & zip::DescriptorFollows) != 0;
    const auto fields = [&](bool summed) {
      return little(20, 2) + little(flags_, 2) + little(method_, 2) + little(0, 4) +
             (summed ? sum : little(0, 12)) + little(name.size(), 2) + little(0, 2);
    };
    centralAt_[name] = central_.size();
    localAt_[name] = bytes_.size();
    central_ += little(zip::CentralSignature, 4) + little(20, 2) + fields(true) + little(0, 10) +
                little(bytes_.size(), 4) + name;
    bytes_ += little(zip::LocalSignature, 4) + fields(!described) + name + packed;
    if (described) bytes_ += little(zip::DescriptorSignature, 4) + sum;
    return *this;
  }

  /// Changes a field of a file's two headers.
  Zip& local(const std::string& name, Field field, std::uint64_t value, std::size_t size = 4) {
    bytes_.replace(localAt_.at(name) + field, size, little(value, size));
    return *this;
  }
  Zip& central(const std::string& name, Field field, std::uint64_t value, std::size_t size = 4) {
    central_.replace(centralAt_.at(name) + 2 + field, size, little(value, size));
    return *this;
  }
  Zip& both(const std::string& name, Field field, std::uint64_t value, std::size_t size = 4) {
    return local(name, field, value, size).central(name, field, value, size);
  }
  /// Has the directory say that a file begins where another one does.
  Zip& overlap(const std::string& name, const std::string& other) {
    central_.replace(centralAt_.at(name) + 42, 4, little(localAt_.at(other), 4));
    return *this;
  }
  /// Lists a file a second time, with another checksum.
  Zip& listAgain(const std::string& name) {
    central_ += central_.substr(centralAt_.at(name), zip::CentralSize + name.size());
    centralAt_[name + " again"] = central_.size() - zip::CentralSize - name.size();
    return central(name + " again", Checksum, 7);
  }
  /// Lists a file before all others, wherever it stands; the last change of its archive.
  Zip& listFirst(const std::string& name) {
    const std::size_t size = zip::CentralSize + name.size();
    const std::string record = central_.substr(centralAt_.at(name), size);
    central_ = record + central_.erase(centralAt_.at(name), size);
    return *this;
  }
  /// Turns a byte of what a file holds, or of what stands behind it, around.
  Zip& spoil(const std::string& name, std::size_t at) {
    bytes_[localAt_.at(name) + zip::LocalSize + name.size() + at] ^= 0x11;
    return *this;
  }

  std::string bytes() const {
    return bytes_ + central_ + little(zip::EndSignature, 4) + little(0, 4) +
           little(centralAt_.size(), 2) + little(centralAt_.size(), 2) +
           little(central_.size(), 4) + little(bytes_.size(), 4) + little(0, 2);
  }

 private:
  const std::uint16_t method_, flags_;
  std::string bytes_, central_;
  std::map<std::string, std::size_t> localAt_, centralAt_;
};

const std::string Script = "#!/bin/sh\necho hello, hello, hello\n";
const std::string Name = "Sample.app/run.sh";

Zip sample(std::uint16_t method = zip::Deflated, std::uint16_t flags = 0) {
  return Zip(method, flags).add("Sample.app/Info.plist", infoPlist()).add(Name, Script);
}

/// What the sample's script is read as in one piece; "left" when that is left to the library.
std::string inOnePiece(const std::string& archive, std::uint64_t largest = Largest,
                       const std::string& name = Name) {
  const FileDescriptor file = memoryFile(archive);
  std::vector<ZipMember> members;
  if (const auto error = readZipDirectory(file.get(), 100, members)) return description(*error);
  ZipMembers archived(file.get(), members, largest);
  const auto bytes = archived.contents(1, name);
  return bytes ? std::string(asText(*bytes)) : "left";
}

/// What comes of unpacking, which must be the same when the archive library reads all of it.
std::string unpacked(const std::string& archive) {
  const Outcome outcome = unpack(archive);
  PackageLimits limits;
  limits.wholeFile = 0;
  const Outcome other = unpack(archive, "com.example.sample", limits);
  EXPECT_EQ(outcome.result() + " " + outcome.reason(), other.result() + " " + other.reason());
  EXPECT_EQ(outcome.files, other.files);
  return outcome.result();
}

TEST(ZipMembers, ArePlainFilesOfAllUsualTools) {
  for (const std::uint16_t method : {zip::Stored, zip::Deflated}) {
    for (const unsigned flags : {0u, 2u, 8u, 0x808u}) {
      const std::string archive = sample(method, static_cast<std::uint16_t>(flags)).bytes();
      EXPECT_EQ(inOnePiece(archive), Script) << method << " " << flags;
      EXPECT_EQ(unpacked(archive), "ok") << method << " " << flags;
    }
  }
  for (const ArchiveForm form : {ArchiveForm::Zip, ArchiveForm::StoredZip})
    EXPECT_EQ(
        inOnePiece(buildArchive(form, {{"Sample.app/Info.plist", infoPlist()}, {Name, Script}})),
        Script);
}

TEST(ZipMembers, AreUnpackedInOnePieceUpToTheLimit) {
  const auto pieces = [](std::size_t size) {
    const std::string name = "Sample.app/large";
    const FileDescriptor file = memoryFile(sample().add(name, std::string(size, 'x')).bytes());
    PackageReader reader(file.get(), {});
    PackageItem item;
    std::optional<Error> error;
    std::size_t count = 0;
    const auto take = [&](std::uint64_t, ByteView) {
      ++count;
      return std::optional<Error>();
    };
    std::uint64_t taken = 0;
    while (item.path != name && reader.next(item, error)) continue;
    EXPECT_TRUE(!reader.readFile(take, taken) && taken == size);
    return count;
  };
  EXPECT_EQ(pieces(1 << 20), 1u);
  EXPECT_GT(pieces((1 << 20) + 1), 1u);
}

TEST(ZipMembers, MayBeListedInAnyOrder) {
  const std::string archive = sample().listFirst(Name).bytes();
  EXPECT_EQ(inOnePiece(archive), Script);
  EXPECT_EQ(unpacked(archive), "ok");
}

TEST(ZipMembers, MayBeEmpty) {
  for (const std::uint16_t method : {zip::Stored, zip::Deflated})
    EXPECT_EQ(
        inOnePiece(Zip(method).add("Sample.app/Info.plist", infoPlist()).add(Name, "").bytes()),
        "");
}

TEST(ZipMembers, ThatAreLargeAreLeftToTheLibrary) {
  EXPECT_EQ(inOnePiece(sample(zip::Stored).bytes(), Script.size()), Script);
  EXPECT_EQ(inOnePiece(sample(zip::Stored).bytes(), Script.size() - 1), "left");
  EXPECT_EQ(inOnePiece(sample().bytes(), Script.size() - 1), "left");
}

TEST(ZipMembers, OfAnotherNameAreLeftToTheLibrary) {
  EXPECT_EQ(inOnePiece(sample().bytes(), Largest, "Sample.app/run.s"), "left");
  EXPECT_EQ(inOnePiece(sample().bytes(), Largest, "Sample.app/run.sH"), "left");
}

struct Wrong {
  std::string what;
  Zip archive;
  std::string result;  ///< the library's
};

std::vector<Wrong> wrongArchives() {
  const auto size = Script.size();
  const auto packed = deflated(Script).size();
  const auto described = [] { return sample(zip::Deflated, zip::DescriptorFollows); };
  return {
      {"smaller than it is", sample().both(Name, Size, size - 1), "damaged"},
      {"larger than it is", sample().both(Name, Size, size + 1), "damaged"},
      {"stored, smaller", sample(zip::Stored).both(Name, Size, size - 1), "damaged"},
      {"packed smaller", sample().both(Name, Packed, packed - 1), "damaged"},
      {"packed larger", sample().both(Name, Packed, packed + 1), "damaged"},
      {"packed past the end", sample().both(Name, Packed, 100'000), "damaged"},
      {"sizes past 4 GiB", sample().both(Name, Packed, 0xffffffff).both(Name, Size, 0xffffffff),
       "damaged"},
      {"wrong checksum", sample().both(Name, Checksum, 7), "damaged"},
      {"wrong data", sample().spoil(Name, 5), "damaged"},
      {"wrong stored data", sample(zip::Stored).spoil(Name, 5), "damaged"},
      {"other checksum in front", sample().local(Name, Checksum, 7), "damaged"},
      {"other size in front", sample().local(Name, Size, size + 1), "damaged"},
      {"other packed size in front", sample().local(Name, Packed, packed + 1), "damaged"},
      {"other method in front", sample().local(Name, Method, zip::Stored, 2), "damaged"},
      {"other flags in front", sample().local(Name, Flags, zip::DescriptorFollows, 2), "ok"},
      {"other checksum behind", described().spoil(Name, packed + 4), "ok"},
      {"other packed size behind", described().spoil(Name, packed + 8), "ok"},
      {"other size behind", described().spoil(Name, packed + 12), "ok"},
      {"no mark behind", described().spoil(Name, packed), "ok"},
      {"encrypted in front", sample().local(Name, Flags, zip::Encrypted, 2), "encrypted"},
      {"strongly encrypted", sample().both(Name, Flags, 0x40, 2), "encrypted"},
      {"patched", sample().both(Name, Flags, 0x20, 2), "ok"},
      {"unknown method", sample().both(Name, Method, 99, 2), "damaged"},
      {"deflate64", sample().both(Name, Method, 9, 2), "damaged"},
  };
}

TEST(ZipMembers, ThatAreWrongAreLeftToTheLibrary) {
  for (const Wrong& wrong : wrongArchives()) {
    SCOPED_TRACE(wrong.what);
    EXPECT_EQ(inOnePiece(wrong.archive.bytes()), "left");
    EXPECT_EQ(unpacked(wrong.archive.bytes()), wrong.result);
  }
}

TEST(ZipMembers, MayNotBeListedTwice) {
  const std::string other = "Sample.app/run.SH";
  EXPECT_EQ(unpacked(sample().add(other, "").overlap(other, Name).bytes()), "damaged");
  EXPECT_EQ(unpacked(sample().listAgain(Name).bytes()), "duplicate name");
}

}  // namespace
}  // namespace appsync::package_tests
