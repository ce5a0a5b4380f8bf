// Control side of the in-memory test back-end "memtest". The test programs
// link the plug-in, so the object that libvyr loads by its file name is this
// same one and shares its tables.
#pragma once

#include <cstdint>

namespace memtest {

// Answers of the entries that tests can set; the defaults are in memtest.cc.
enum Knob {
	kOpenErrno,   // non-zero: open*db_r fails with this errno
	kCloseResult, // result of close*db_r
	kSetResult,   // result of set*ent_r
	kPutResult,   // result of put*ent_r (which store nothing)
	kLchResult,   // result of do_getlch / do_setlch (7)
	kMissErrno,   // errno of a lookup that finds nothing (ENOENT)
	kEilseqValue, // a value that getlevval_r / getcatval_r declare known without a record (0: none)
	kKnobCount
};

} // namespace memtest

extern "C" {
void memtest_ctl_knob(int knob, long long value);
// Entries keep insertion order, which is the walk order; a user row with
// uid -1 has no uid.
void memtest_ctl_add_mac(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2,
			 long long uid);
void memtest_ctl_add_lev(const char *name, unsigned value);
void memtest_ctl_add_cat(const char *name, uint64_t value);
// One line per entry call, "<entry> #<handle> <what it got>", with the
// exact bytes of any name. The log never allocates, so it can stay on
// during allocation-failure sweeps.
const char *memtest_ctl_log(void);
void memtest_ctl_clear_log(void);
// Handles opened and not yet closed.
long memtest_ctl_live_handles(void);
// The address of the last name (or record) an entry was given, so that tests
// can tell the caller's own string from a copy.
const void *memtest_ctl_last_name(void);
const void *memtest_ctl_last_record(void);
}
