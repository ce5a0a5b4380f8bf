// Harness of the name database tests that go through the switch.
//
// The test program defines the configuration block and dbroute_init itself,
// so libvyr binds to this stand-in: tests set the back-end names and
// charsets they want, can make dbroute_init fail, and count its calls. A
// database's start-up state lasts as long as its process, so each test body
// runs in a fresh child process.
#pragma once

#include <vyr/namedb.h>

#include "contract/dbroute.h"
#include "namedb/plugins/memtest.h"
#include "support/entries.hh"
#include "support/failalloc.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>

namespace nd_test {

using vyr_test::failed_with;
using vyr_test::take;

extern int g_init_calls;  // calls of dbroute_init so far
extern int g_init_result; // its answer; a negative one fails with EIO

// "Секрет" in the locale's UTF-8 and in the back-ends' KOI8-R.
constexpr const char *kSecretUtf8 = "\xd0\xa1\xd0\xb5\xd0\xba\xd1\x80\xd0\xb5\xd1\x82";
constexpr const char *kSecretKoi8 = "\xf3\xc5\xcb\xd2\xc5\xd4";

// Sets one text field of the configuration block.
void set_field(char (&field)[DBROUTE_NAME_MAX], const std::string &value);
// Points all three databases at `backend` with the given charset.
void configure_all(const char *backend, const char *charset);

// Runs body in a forked child and expects it to end without a test failure
// or a leak; the child prints its own failures.
void in_fresh_process(const std::function<void()> &body);

// A fresh process in the C.UTF-8 locale with every database on the memtest
// plug-in; the user and level databases declare `charset`, the category
// database `cat_charset`. The three databases are started before `body`.
void with_memtest(const std::function<void()> &body, const char *charset = "UTF-8",
		  const char *cat_charset = "UTF-8");

// The results of `call` with each of its allocations failing in turn, and
// at last with none failing, joined by " | ". A warm-up call comes first: it
// loads what stays cached for the life of the process (charset modules).
template <class Call>
std::string sweep_results(Call &&call)
{
	take(call());
	std::string out;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		const std::string got = take(inj.run(call));
		out += (out.empty() ? "" : " | ") + got;
	});
	return out;
}

// Whether strdup takes its block from the failing allocator; under a
// sanitizer it does not, and sweeps see one failure point less.
inline bool strdup_can_fail()
{
	vyr_test::Injector inj(1);
	char *p = inj.run([] { return strdup("x"); });
	std::free(p);
	return p == nullptr;
}

// The plug-in's log, and shorthands for its control interface.
inline std::string log() { return memtest_ctl_log(); }
inline void knob(memtest::Knob k, long long v) { memtest_ctl_knob(k, v); }

} // namespace nd_test
