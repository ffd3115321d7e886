#include <gtest/gtest.h>

#include "tests/packages/package_builder.h"

namespace appsync::package_tests {
namespace {

class DamagedPackage : public ::testing::TestWithParam<ArchiveForm> {
 protected:
  const std::string whole_ = buildArchive(GetParam(), sampleEntries());
  const Outcome sound_ = unpack(whole_);

  void expectRefusedOrTheSame(const std::string& package, std::size_t at) {
    const Outcome outcome = unpack(package);
    EXPECT_FALSE(outcome.outsideTouched) << at;
    if (!outcome.package) return;
    EXPECT_TRUE(outcome.files == sound_.files) << "other files at " << at;
    EXPECT_EQ(outcome.package->bytes, sound_.package->bytes) << at;
  }
};

TEST_P(DamagedPackage, CutOffAnywhereIsRefusedOrGivesTheSame) {
  ASSERT_EQ(sound_.result(), "ok") << sound_.reason();
  for (std::size_t size = 0; size < whole_.size(); size += whole_.size() / 100)
    expectRefusedOrTheSame(whole_.substr(0, size), size);
  for (std::size_t size = 0; size < whole_.size(); size += 512)  // between two entries of a tar
    expectRefusedOrTheSame(whole_.substr(0, size), size);
  for (std::size_t missing = 1; missing <= 60; ++missing)  // within checksums and end records
    expectRefusedOrTheSame(whole_.substr(0, whole_.size() - missing), whole_.size() - missing);
}

TEST_P(DamagedPackage, WithOneWrongByteIsRefusedOrGivesTheSame) {
  // A plain tar archive carries no checksum of what it holds; the zstd that is made here neither.
  if (GetParam() == ArchiveForm::Tar || GetParam() == ArchiveForm::TarZst) return;
  for (std::size_t at = 0; at < whole_.size(); at += 1 + whole_.size() / 300) {
    std::string package = whole_;
    package[at] = static_cast<char>(package[at] ^ 0x10);
    expectRefusedOrTheSame(package, at);
  }
}

INSTANTIATE_TEST_SUITE_P(AllForms, DamagedPackage,
                         ::testing::Values(ArchiveForm::Zip, ArchiveForm::StoredZip,
                                           ArchiveForm::Tar, ArchiveForm::TarGz,
                                           ArchiveForm::TarBz2, ArchiveForm::TarXz,
                                           ArchiveForm::TarZst, ArchiveForm::TarLz4,
                                           ArchiveForm::TarLzip),
                         [](const auto& test) { return std::string(name(test.param)); });

}  // namespace
}  // namespace appsync::package_tests
