#pragma once

#include <functional>

#include "platform/file_manager.h"

namespace appsync::fakes {

/// Passes every call on; takes a step before each change. Borrows the files.
class SteppingFileManager final : public FileManager {
 public:
  SteppingFileManager(FileManager& files, std::function<void()> step)
      : files_(files), step_(std::move(step)) {}

  std::optional<Bytes> contentsAtPath(std::string_view path,
                                      std::optional<Error>* error) noexcept override {
    return files_.contentsAtPath(path, error);
  }
  bool writeAtomically(std::string_view path, ByteView bytes,
                       std::optional<Error>* error) noexcept override {
    step_();
    return files_.writeAtomically(path, bytes, error);
  }
  bool createFile(std::string_view path, ByteView bytes,
                  const FileAttributes& attributes) noexcept override {
    step_();
    return files_.createFile(path, bytes, attributes);
  }
  bool createDirectory(std::string_view path, bool withIntermediates,
                       const FileAttributes& attributes,
                       std::optional<Error>* error) noexcept override {
    step_();
    return files_.createDirectory(path, withIntermediates, attributes, error);
  }
  bool removeItem(std::string_view path, std::optional<Error>* error) noexcept override {
    step_();
    return files_.removeItem(path, error);
  }
  bool moveItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override {
    step_();
    return files_.moveItem(from, to, error);
  }
  bool copyItem(std::string_view from, std::string_view to,
                std::optional<Error>* error) noexcept override {
    step_();
    return files_.copyItem(from, to, error);
  }
  bool fileExists(std::string_view path) noexcept override { return files_.fileExists(path); }
  bool directoryExists(std::string_view path) noexcept override {
    return files_.directoryExists(path);
  }
  std::optional<ItemAttributes> attributesOfItem(std::string_view path,
                                                 std::optional<Error>* error) noexcept override {
    return files_.attributesOfItem(path, error);
  }
  bool touch(std::string_view path, std::optional<Error>* error) noexcept override {
    return files_.touch(path, error);
  }
  std::string temporaryDirectory() noexcept override { return files_.temporaryDirectory(); }

 private:
  FileManager& files_;
  const std::function<void()> step_;
};

}  // namespace appsync::fakes
