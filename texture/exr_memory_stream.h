#pragma once

#include <Iex.h>
#include <ImfIO.h>

#include <cstdint>
#include <cstring>
#include <string>

/// An OpenEXR input stream over bytes in memory, so that EXR files are decoded from the same
/// buffers as every other format.
namespace ox {

class ExrMemoryStream final : public Imf::IStream {
public:
    ExrMemoryStream(const std::string &name, const uint8_t *data, size_t size)
        : Imf::IStream(name.c_str()), data_(data), size_(size) {}

    bool isMemoryMapped() const override { return false; }
    bool read(char c[], int n) override {
        if (n < 0 || uint64_t(n) > size_ - pos_) throw Iex::InputExc("Unexpected end of file.");
        std::memcpy(c, data_ + pos_, size_t(n));
        pos_ += uint64_t(n);
        return pos_ < size_;
    }
    uint64_t tellg() override { return pos_; }
    void seekg(uint64_t pos) override {
        if (pos > size_) throw Iex::InputExc("Seek past the end of the file.");
        pos_ = pos;
    }
    void clear() override {}

private:
    const uint8_t *data_;
    uint64_t size_;
    uint64_t pos_ = 0;
};

}  // namespace ox
