// Stored form of a label: decoding, checking, encoding and filling records.
#include "label_codec.hh"

#include <bit>
#include <cerrno>
#include <cstring>

namespace tavrel {
namespace {

// Little-endian loads and stores at any alignment, so the stored form is the
// same whatever the host order.  memcpy keeps them free of alignment and
// aliasing trouble and compiles to a single move on a little-endian host.
template <class T>
T from_le(T v) noexcept
{
	if constexpr (std::endian::native == std::endian::little)
		return v;
	// The byte reversal: its own inverse, so it serves stores as well.
	T r = 0;
	for (size_t i = 0; i < sizeof v; ++i, v = static_cast<T>(v >> 8))
		r = static_cast<T>((r << 8) | (v & 0xff));
	return r;
}

template <class T>
T load_le(const uint8_t *p) noexcept
{
	T v;
	std::memcpy(&v, p, sizeof v);
	return from_le(v);
}

template <class T>
void store_le(uint8_t *p, T v) noexcept
{
	v = from_le(v);
	std::memcpy(p, &v, sizeof v);
}

// Offsets of the fields of the head.
constexpr size_t kOffVersion = 0;
constexpr size_t kOffType = 2;
constexpr size_t kOffLev = 4;
constexpr size_t kOffIlev = 5;
constexpr size_t kOffCat = 6;
constexpr size_t kOffBlobSize = 14;
constexpr size_t kOffNroles1 = 18;
constexpr size_t kOffNroles2 = 22;
static_assert(kOffNroles2 + 4 == kHeadSize);

// Offsets within a stored role entry.
constexpr size_t kOffRoleId = 0;
constexpr size_t kOffRoleAttr = 8;
constexpr size_t kOffRoleRights = 12;
static_assert(kOffRoleRights + 1 == kRoleSize);

// Form size for the given sizes; 64-bit arithmetic, so no count can wrap it.
constexpr uint64_t form_size(uint64_t blob, uint64_t n1, uint64_t n2) noexcept
{
	return kHeadSize + blob + kRoleSize * (n1 + n2);
}

uint64_t stored_role_id(const uint8_t *entries, uint32_t i) noexcept
{
	return load_le<uint64_t>(entries + size_t{i} * kRoleSize + kOffRoleId);
}

// Whether n stored entries are in strictly descending order of id.
bool stored_roles_canonical(const uint8_t *entries, uint32_t n) noexcept
{
	for (uint32_t i = 1; i < n; ++i)
		if (stored_role_id(entries, i - 1) <= stored_role_id(entries, i))
			return false;
	return true;
}

// Whether n in-memory entries are in strictly descending order of id.
bool roles_canonical(const vyr_role_t *roles, uint32_t n) noexcept
{
	for (uint32_t i = 1; i < n; ++i)
		if (roles[i - 1].id <= roles[i].id)
			return false;
	return true;
}

uint8_t *encode_roles(uint8_t *p, const vyr_role_t *roles, uint32_t n) noexcept
{
	for (uint32_t i = 0; i < n; ++i, p += kRoleSize) {
		store_le<uint64_t>(p + kOffRoleId, roles[i].id);
		store_le<uint32_t>(p + kOffRoleAttr, roles[i].attr);
		p[kOffRoleRights] = roles[i].rights;
	}
	return p;
}

void decode_roles(vyr_role_t *roles, const uint8_t *p, uint32_t n) noexcept
{
	for (uint32_t i = 0; i < n; ++i, p += kRoleSize) {
		// Built from a zeroed entry and stored whole, so the padding bytes
		// the caller sees are zero rather than stale.
		vyr_role_t r{};
		r.id = load_le<uint64_t>(p + kOffRoleId);
		r.attr = load_le<uint32_t>(p + kOffRoleAttr);
		r.rights = p[kOffRoleRights];
		roles[i] = r;
	}
}

} // namespace

int decode_label(const uint8_t *data, size_t len, StoredLabel *out) noexcept
{
	if (len < kHeadSize)
		return EIO;
	if (load_le<uint16_t>(data + kOffVersion) != kFormVersion)
		return EINVAL;
	StoredLabel s;
	s.type = load_le<uint16_t>(data + kOffType);
	s.lev = data[kOffLev];
	s.ilev = data[kOffIlev];
	s.cat = load_le<uint64_t>(data + kOffCat);
	s.blob_size = load_le<uint32_t>(data + kOffBlobSize);
	s.nroles1 = load_le<uint32_t>(data + kOffNroles1);
	s.nroles2 = load_le<uint32_t>(data + kOffNroles2);
	// Exact length: a short form is truncated, a long one has been tampered
	// with or written by something else.
	if (form_size(s.blob_size, s.nroles1, s.nroles2) != len)
		return EIO;
	const uint8_t *p = data + kHeadSize;
	s.blob = s.blob_size ? p : nullptr;
	p += s.blob_size;
	s.roles1 = s.nroles1 ? p : nullptr;
	p += size_t{s.nroles1} * kRoleSize;
	s.roles2 = s.nroles2 ? p : nullptr;
	if (!stored_roles_canonical(s.roles1, s.nroles1) || !stored_roles_canonical(s.roles2, s.nroles2))
		return EIO;
	*out = s;
	return 0;
}

int check_label(const vyrl_t *label) noexcept
{
	if (!label || !label->ml || !label->rl)
		return EFAULT;
	const vyrml_t &ml = *label->ml;
	const vyrrl_t &rl = *label->rl;
	if ((ml.blob_size && !ml.blob) || (rl.nroles1 && !rl.roles1) || (rl.nroles2 && !rl.roles2))
		return EFAULT;
	if (form_size(ml.blob_size, rl.nroles1, rl.nroles2) > kMaxFormSize)
		return ENOSPC;
	if (!roles_canonical(rl.roles1, rl.nroles1) || !roles_canonical(rl.roles2, rl.nroles2))
		return EINVAL;
	return 0;
}

size_t encoded_size(const vyrl_t *label) noexcept
{
	return form_size(label->ml->blob_size, label->rl->nroles1, label->rl->nroles2);
}

void encode_label(const vyrl_t *label, uint8_t *out) noexcept
{
	const vyrml_t &ml = *label->ml;
	const vyrrl_t &rl = *label->rl;
	store_le<uint16_t>(out + kOffVersion, kFormVersion);
	store_le<uint16_t>(out + kOffType, ml.type);
	out[kOffLev] = ml.lev;
	out[kOffIlev] = ml.ilev;
	store_le<uint64_t>(out + kOffCat, ml.cat);
	store_le<uint32_t>(out + kOffBlobSize, ml.blob_size);
	store_le<uint32_t>(out + kOffNroles1, rl.nroles1);
	store_le<uint32_t>(out + kOffNroles2, rl.nroles2);
	uint8_t *p = out + kHeadSize;
	if (ml.blob_size)
		std::memcpy(p, ml.blob, ml.blob_size);
	p += ml.blob_size;
	p = encode_roles(p, rl.roles1, rl.nroles1);
	encode_roles(p, rl.roles2, rl.nroles2);
}

int fill_label(const StoredLabel &s, vyrl_t *label) noexcept
{
	if (!label || !label->ml || !label->rl)
		return EFAULT;
	vyrml_t &ml = *label->ml;
	vyrrl_t &rl = *label->rl;
	if (s.blob_size > ml.blob_size || s.nroles1 > rl.nroles1 || s.nroles2 > rl.nroles2) {
		ml.blob_size = s.blob_size;
		rl.nroles1 = s.nroles1;
		rl.nroles2 = s.nroles2;
		return E2BIG;
	}
	if ((s.blob_size && !ml.blob) || (s.nroles1 && !rl.roles1) || (s.nroles2 && !rl.roles2))
		return EFAULT;
	ml.lev = s.lev;
	ml.ilev = s.ilev;
	ml.cat = s.cat;
	ml.type = s.type;
	ml.blob_size = s.blob_size;
	if (s.blob_size)
		std::memcpy(ml.blob, s.blob, s.blob_size);
	rl.nroles1 = s.nroles1;
	rl.nroles2 = s.nroles2;
	decode_roles(rl.roles1, s.roles1, s.nroles1);
	decode_roles(rl.roles2, s.roles2, s.nroles2);
	return 0;
}

} // namespace tavrel
