#include "Image.h"

#include "FileSystem.h"

// Icons are small; anything past this is not an image we would show.
static constexpr size_t kMaxImageBytes = 64u << 20;

Ref<Image> Image::imageWithContentsOfFile(const std::string& path) {
    auto bytes = FileSystem::readFile(path, kMaxImageBytes);
    if (!bytes) return nullptr;
    return Ref<Image>(new Image(path, std::move(*bytes)));
}

std::string Image::description() const { return "<Image: " + _path + ">"; }
