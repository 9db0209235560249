// An image resource: its file and bytes. Nothing here decodes pixels.
#pragma once

#include "Object.h"

#include <string>
#include <vector>

class Image : public Object {
public:
    // nullptr when the file cannot be read.
    static Ref<Image> imageWithContentsOfFile(const std::string& path);

    const std::string& path() const { return _path; }
    const std::vector<uint8_t>& bytes() const { return _bytes; }
    std::string description() const override;

private:
    Image(std::string path, std::vector<uint8_t> bytes) : _path(std::move(path)), _bytes(std::move(bytes)) {}
    std::string _path;
    std::vector<uint8_t> _bytes;
};
