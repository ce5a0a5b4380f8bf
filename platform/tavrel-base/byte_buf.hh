// A byte buffer with room for small labels inline and a heap block for the
// rare large one.  Used for the stored form on its way in and out, so the
// common command allocates nothing.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>

namespace tavrel {

class ByteBuf {
public:
	// Covers a label with a few dozen roles and a modest blob.
	static constexpr size_t kInline = 512;

	ByteBuf() = default;
	ByteBuf(const ByteBuf &) = delete;
	ByteBuf &operator=(const ByteBuf &) = delete;
	~ByteBuf()
	{
		if (heap_)
			std::free(heap_);
	}

	uint8_t *data() noexcept { return heap_ ? heap_ : inline_; }
	const uint8_t *data() const noexcept { return heap_ ? heap_ : inline_; }
	size_t capacity() const noexcept { return heap_ ? heap_cap_ : kInline; }

	// Makes room for at least n bytes.  The contents are not kept: callers
	// refill the buffer after growing it.  False (errno ENOMEM) on failure,
	// with the buffer as it was.
	bool reserve(size_t n) noexcept
	{
		if (n <= capacity())
			return true;
		auto *p = static_cast<uint8_t *>(std::malloc(n));
		if (!p)
			return false;
		std::free(heap_);
		heap_ = p;
		heap_cap_ = n;
		return true;
	}

private:
	uint8_t inline_[kInline];
	uint8_t *heap_ = nullptr;
	size_t heap_cap_ = 0;
};

} // namespace tavrel
