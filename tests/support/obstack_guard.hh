// Calls that build text on an obstack of their own, run in tests that make
// allocations fail.
//
// When an obstack can't get a chunk, <obstack.h> calls
// obstack_alloc_failed_handler, which must not return (by default it prints
// "memory exhausted" and exits). For the time of one guarded call the
// handler jumps back to the guard instead, which reports it. Nothing of the
// call may be alive at that point; that holds for the library's own
// obstacks, which are begun before the call takes anything else.
#pragma once

#include <csetjmp>
#include <obstack.h>

namespace vyr_test {

namespace obstack_guard_detail {
inline std::jmp_buf *jump_target = nullptr;
[[noreturn]] inline void jump_back() { std::longjmp(*jump_target, 1); }
} // namespace obstack_guard_detail

// Returns f()'s result; *aborted tells whether the obstack failure handler
// ended the call instead (the result is then a value-initialised one).
template <class F>
auto obstack_guarded(F &&f, bool *aborted) -> decltype(f())
{
	namespace d = obstack_guard_detail;
	std::jmp_buf here;
	decltype(f()) volatile result{};
	void (*const saved)(void) = obstack_alloc_failed_handler;
	std::jmp_buf *const saved_target = d::jump_target;
	d::jump_target = &here;
	obstack_alloc_failed_handler = d::jump_back;
	*aborted = setjmp(here) != 0;
	if (!*aborted)
		result = f();
	obstack_alloc_failed_handler = saved;
	d::jump_target = saved_target;
	return result;
}

} // namespace vyr_test
