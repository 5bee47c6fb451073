// The key operations and read_vorn_cfg_file.
#include "volumes/key_operations.h"

#include "config/utf8_text.h"
#include "kolt/env.h"
#include "kolt/local_config.h"
#include "kolt/volume_files.h"

namespace kolt {
namespace {

std::string vornFilePath(const std::string& name) {
  return std::string(kVornDirectory) + name;
}

void markChanged(std::uint8_t* changed) {
  if (changed != nullptr) *changed |= kKeyChanged;
}

}  // namespace

std::optional<std::string> read_vorn_cfg_file(const std::string& name) {
  std::string text;
  if (currentEnv().readFile(vornFilePath(name), &text) != 0) return std::nullopt;
  if (!utf8::isValid(text)) return std::nullopt;
  return text;
}

void copyValue(Dictionary* destination, const Dictionary& source, const std::string& key,
               std::uint8_t* changed) {
  const Value* from = source.find(key);
  const Value* to = destination->find(key);
  if (from != nullptr) {
    if (to != nullptr && *to == *from) return;
    destination->set(key, *from);
    markChanged(changed);
  } else if (to != nullptr) {
    destination->erase(key);
    markChanged(changed);
  }
}

void update_from_file(Dictionary* dictionary, const std::string& fileName, const std::string& key,
                      std::uint8_t* changed) {
  const std::optional<std::string> text = read_vorn_cfg_file(fileName);
  const Value* current = dictionary->find(key);
  if (!text && current == nullptr) return;
  if (text && current != nullptr && *current == Value(*text)) return;
  markChanged(changed);
  if (text) {
    dictionary->set(key, *text);
  } else {
    dictionary->erase(key);
  }
}

void update_from_config(const Dictionary& dictionary, const std::string& fileName,
                        const std::string& key, mode_t mode) {
  Env& env = currentEnv();
  const std::string path = vornFilePath(fileName);
  const Value* value = dictionary.find(key);
  if (value == nullptr) {
    FileInfo info;
    if (env.fileInfo(path, &info) == 0) env.removeFile(path);
    return;
  }
  const std::string* text = value->asString();
  if (text == nullptr) return;
  const std::optional<std::string> onDisk = read_vorn_cfg_file(fileName);
  if (onDisk && *onDisk == *text) {
    // Unchanged text, but never leave the file more open than asked.
    FileInfo info;
    if (env.fileInfo(path, &info) == 0 && (info.mode & ~mode & 0777) != 0) {
      env.setPermissions(path, mode);
    }
    return;
  }
  writeFileAtomically(env, path, *text, mode);
}

}  // namespace kolt
