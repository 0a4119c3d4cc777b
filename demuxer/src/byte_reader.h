// Little-endian loads and a bounded byte cursor for parsing untrusted bytes.
#ifndef PLIMO_BYTE_READER_H
#define PLIMO_BYTE_READER_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <type_traits>

namespace plimo {

template <typename T>
constexpr T load_le(const uint8_t* p) {
    static_assert(std::is_integral_v<T>);
    std::make_unsigned_t<T> v = 0;
    for (size_t i = 0; i < sizeof(T); ++i)
        v = static_cast<decltype(v)>(v | (static_cast<decltype(v)>(p[i]) << (8 * i)));
    return static_cast<T>(v);
}

template <typename T>
inline void store_le(uint8_t* p, T value) {
    auto v = static_cast<std::make_unsigned_t<T>>(value);
    for (size_t i = 0; i < sizeof(T); ++i) p[i] = static_cast<uint8_t>(v >> (8 * i));
}

// Cursor over [data, data + size). Every read reports whether the bytes were
// there; a failed read leaves the cursor where it was.
class ByteReader {
public:
    ByteReader(const uint8_t* data, size_t size) : data_(data), size_(size) {}

    size_t pos() const { return pos_; }
    size_t remaining() const { return size_ - pos_; }
    const uint8_t* cursor() const { return data_ + pos_; }

    template <typename T>
    [[nodiscard]] bool read(T* out) {
        if (remaining() < sizeof(T)) return false;
        *out = load_le<T>(data_ + pos_);
        pos_ += sizeof(T);
        return true;
    }
    [[nodiscard]] bool read_bytes(void* out, size_t n) {
        if (remaining() < n) return false;
        std::memcpy(out, data_ + pos_, n);
        pos_ += n;
        return true;
    }
    [[nodiscard]] bool skip(size_t n) {
        if (remaining() < n) return false;
        pos_ += n;
        return true;
    }
    // Field at a fixed offset of the buffer, independent of the cursor.
    template <typename T>
    [[nodiscard]] bool at(size_t offset, T* out) const {
        if (offset > size_ || size_ - offset < sizeof(T)) return false;
        *out = load_le<T>(data_ + offset);
        return true;
    }

private:
    const uint8_t* data_;
    size_t size_;
    size_t pos_ = 0;
};

}  // namespace plimo

// Early return from a parser when a check fails.
#define RCHECK(cond)            \
    do {                        \
        if (!(cond)) return false; \
    } while (0)

#endif  // PLIMO_BYTE_READER_H
