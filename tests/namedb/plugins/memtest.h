// Control side of the in-memory test back-end "memtest". The test program
// links the plug-in, so the object libvyr loads by file name is this one.
#pragma once

#include <cstdint>

namespace memtest {
// Settable answers of the entries (defaults in memtest.cc).
enum Knob {
	kOpenErrno,   // non-zero: open*db_r fails with this errno
	kCloseResult, // close*db_r
	kSetResult,   // set*ent_r
	kPutResult,   // put*ent_r, which store nothing
	kLchResult,   // do_getlch / do_setlch (7)
	kMissErrno,   // errno of a lookup that finds nothing (ENOENT)
	kEilseqValue, // a value that get*val_r declare known without a record
	kKnobCount
};
} // namespace memtest

extern "C" {
void memtest_ctl_knob(int knob, long long value);
// Rows keep insertion order (the walk order); a user with uid -1 has none.
void memtest_ctl_add_mac(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2,
			 long long uid);
void memtest_ctl_add_lev(const char *name, unsigned value);
void memtest_ctl_add_cat(const char *name, uint64_t value);
// "<entry> #<handle> <argument>\n" per call, names as their bytes in [];
// never allocates, so it can run inside allocation sweeps.
const char *memtest_ctl_log(void);
void memtest_ctl_clear_log(void);
long memtest_ctl_live_handles(void);
const void *memtest_ctl_last_arg(void); // the last name or record an entry got
}
