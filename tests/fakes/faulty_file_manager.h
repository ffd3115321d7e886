#pragma once

#include "platform/file_manager.h"
#include "tests/fakes/fault_plan.h"

namespace appsync::fakes {

/// Passes every call on, but for those that the plan lets fail; a failed call changes nothing.
class FaultyFileManager : public FileManager {
 public:
  FaultyFileManager(FileManager& files, FaultPlan& plan) : files_(files), plan_(plan) {}

  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error) noexcept override {
    if (plan_.strikes("FileManager.contentsAtPath", path, error)) return std::nullopt;
    return files_.contentsAtPath(path, error);
  }
  bool writeAtomically(std::string_view path, ByteView bytes,
                       std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.writeAtomically", path, error) &&
           files_.writeAtomically(path, bytes, error);
  }
  bool createFile(std::string_view path, ByteView bytes,
                  const FileAttributes& attributes) noexcept override {
    return !plan_.next("FileManager.createFile", path) &&
           files_.createFile(path, bytes, attributes);
  }
  bool createDirectory(std::string_view path, bool withIntermediates,
                       const FileAttributes& attributes,
                       std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.createDirectory", path, error) &&
           files_.createDirectory(path, withIntermediates, attributes, error);
  }
  bool removeItem(std::string_view path, std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.removeItem", path, error) && files_.removeItem(path, error);
  }
  bool moveItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.moveItem", from, error) && files_.moveItem(from, to, error);
  }
  bool copyItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.copyItem", from, error) && files_.copyItem(from, to, error);
  }
  bool fileExists(std::string_view path) noexcept override {
    return !plan_.next("FileManager.fileExists", path) && files_.fileExists(path);
  }
  bool directoryExists(std::string_view path) noexcept override {
    return !plan_.next("FileManager.directoryExists", path) && files_.directoryExists(path);
  }
  std::optional<ItemAttributes> attributesOfItem(std::string_view path,
                                                 std::optional<Error>* error) noexcept override {
    if (plan_.strikes("FileManager.attributesOfItem", path, error)) return std::nullopt;
    return files_.attributesOfItem(path, error);
  }
  bool touch(std::string_view path, std::optional<Error>* error) noexcept override {
    return !plan_.strikes("FileManager.touch", path, error) && files_.touch(path, error);
  }
  std::string temporaryDirectory() noexcept override { return files_.temporaryDirectory(); }

 private:
  FileManager& files_;
  FaultPlan& plan_;
};

}  // namespace appsync::fakes
