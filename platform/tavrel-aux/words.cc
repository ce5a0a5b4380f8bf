// Byte order and unaligned word access.
//
// The byte-order pairs convert between host order and little-endian; the
// word setters store big-endian (network order), so a buffer written with
// them reads the same on any host.  All access goes through memcpy, which
// is valid at any alignment and compiles to a single load or store.
#include "contract/tavrel_aux.h"

#include <bit>
#include <concepts>
#include <cstring>

namespace {

template <std::unsigned_integral T>
constexpr T byteswap(T v) noexcept
{
	T out = 0;
	for (unsigned i = 0; i < sizeof(T); ++i) {
		out = static_cast<T>((out << 8) | (v & 0xffu));
		v = static_cast<T>(v >> 8);
	}
	return out;
}

template <std::unsigned_integral T>
constexpr T to_little(T v) noexcept
{
	if constexpr (std::endian::native == std::endian::little)
		return v;
	else
		return byteswap(v);
}

template <std::unsigned_integral T>
constexpr T to_big(T v) noexcept
{
	if constexpr (std::endian::native == std::endian::big)
		return v;
	else
		return byteswap(v);
}

static_assert(byteswap<uint16_t>(0x0102) == 0x0201);
static_assert(byteswap<uint32_t>(0x01020304) == 0x04030201);
static_assert(byteswap<uint64_t>(0x0102030405060708) == 0x0807060504030201);

template <std::unsigned_integral T>
void store_big(void *p, T v) noexcept
{
	const T be = to_big(v);
	std::memcpy(p, &be, sizeof be);
}

template <std::unsigned_integral T>
T load_big(const void *p) noexcept
{
	T be;
	std::memcpy(&be, p, sizeof be);
	return to_big(be);  // the swap is its own inverse
}

} // namespace

extern "C" {

uint16_t zenk_cputole16(uint16_t v) noexcept { return to_little(v); }
uint32_t zenk_cputole32(uint32_t v) noexcept { return to_little(v); }
uint64_t zenk_cputole64(uint64_t v) noexcept { return to_little(v); }
uint16_t zenk_le16tocpu(uint16_t v) noexcept { return to_little(v); }
uint32_t zenk_le32tocpu(uint32_t v) noexcept { return to_little(v); }
uint64_t zenk_le64tocpu(uint64_t v) noexcept { return to_little(v); }

void zenk_set_w8(void *p, uint8_t v) noexcept { store_big(p, v); }
void zenk_set_w16(void *p, uint16_t v) noexcept { store_big(p, v); }
void zenk_set_w32(void *p, uint32_t v) noexcept { store_big(p, v); }
void zenk_set_w64(void *p, uint64_t v) noexcept { store_big(p, v); }
uint8_t zenk_get_w8(const void *p) noexcept { return load_big<uint8_t>(p); }
uint16_t zenk_get_w16(const void *p) noexcept { return load_big<uint16_t>(p); }
uint32_t zenk_get_w32(const void *p) noexcept { return load_big<uint32_t>(p); }
uint64_t zenk_get_w64(const void *p) noexcept { return load_big<uint64_t>(p); }

} // extern "C"
