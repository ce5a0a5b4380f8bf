// Running library calls that build text on an obstack of their own, in tests
// that make allocations fail.
//
// When an obstack itself cannot get memory, <obstack.h> calls
// obstack_alloc_failed_handler, which must not return (its default prints
// "memory exhausted" and exits).  For the duration of one guarded call the
// handler jumps back to the guard instead, and the guard reports it.  Nothing
// of the call may be alive at that point; that holds for the library's own
// obstacks, which are begun before the call takes anything else.
#pragma once

#include <csetjmp>
#include <obstack.h>
#include <type_traits>

namespace textout_test {

namespace guard_detail {
inline std::jmp_buf *jump_target = nullptr;

[[noreturn]] inline void jump_back()
{
	std::longjmp(*jump_target, 1);
}

inline char *run(char *(*call)(void *), void *arg, bool *aborted)
{
	std::jmp_buf here;
	void (*saved)(void) = obstack_alloc_failed_handler;
	std::jmp_buf *saved_target = jump_target;
	char *volatile result = nullptr;
	*aborted = false;
	jump_target = &here;
	obstack_alloc_failed_handler = jump_back;
	if (setjmp(here) == 0)
		result = call(arg);
	else
		*aborted = true;
	obstack_alloc_failed_handler = saved;
	jump_target = saved_target;
	return result;
}
} // namespace guard_detail

// Calls f(); *aborted tells whether the obstack failure handler ended it.
template <class F>
char *guarded(F &&f, bool *aborted)
{
	using Fn = std::remove_reference_t<F>;
	return guard_detail::run([](void *p) { return (*static_cast<Fn *>(p))(); },
	                         const_cast<void *>(static_cast<const void *>(&f)), aborted);
}

} // namespace textout_test
