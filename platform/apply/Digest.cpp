#include "platform/apply/Digest.h"

#include <bit>
#include <cstddef>

namespace platform::apply {
namespace {

// Little-endian, whatever the machine is.
template <class Bytes>
std::uint64_t wordAt(const Bytes& bytes, std::size_t offset, std::size_t count) noexcept {
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < count; ++i) {
        word |= std::uint64_t{static_cast<std::uint8_t>(bytes[offset + i])} << (8U * i);
    }
    return word;
}

struct State {
    std::uint64_t v0, v1, v2, v3;

    void rounds(int count) noexcept {
        for (int i = 0; i < count; ++i) {
            v0 += v1;
            v1 = std::rotl(v1, 13) ^ v0;
            v0 = std::rotl(v0, 32);
            v2 += v3;
            v3 = std::rotl(v3, 16) ^ v2;
            v0 += v3;
            v3 = std::rotl(v3, 21) ^ v0;
            v2 += v1;
            v1 = std::rotl(v1, 17) ^ v2;
            v2 = std::rotl(v2, 32);
        }
    }
    void take(std::uint64_t word) noexcept {
        v3 ^= word;
        rounds(2);
        v0 ^= word;
    }
};

}  // namespace

std::uint64_t sipHash(const std::array<std::uint8_t, 16>& key, std::string_view text) noexcept {
    const std::uint64_t k0 = wordAt(key, 0, 8);
    const std::uint64_t k1 = wordAt(key, 8, 8);
    State state{k0 ^ 0x736F6D6570736575U, k1 ^ 0x646F72616E646F6DU, k0 ^ 0x6C7967656E657261U,
                k1 ^ 0x7465646279746573U};
    const std::size_t whole = text.size() / 8 * 8;
    for (std::size_t i = 0; i < whole; i += 8) {
        state.take(wordAt(text, i, 8));
    }
    state.take(wordAt(text, whole, text.size() - whole) | (std::uint64_t{text.size()} << 56U));
    state.v2 ^= 0xFFU;
    state.rounds(4);
    return state.v0 ^ state.v1 ^ state.v2 ^ state.v3;
}

}  // namespace platform::apply
