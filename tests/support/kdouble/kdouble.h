// A scripted label service shared by the tests: libvyr_kdouble.so defines the
// three tavrel_* functions and, named in LIBS of vyr_add_gtest, comes before
// libvyr.so.2 and so ahead of the real service library.  A command reads the
// script and writes into fixed room only: it allocates nothing, so the
// failing allocator only ever hits the library under test.
#pragma once

#include "contract/tavrel_base.h"

#include <array>
#include <tuple>
#include <vector>

namespace kdouble {

constexpr std::size_t kMaxBlob = 64, kMaxRoles = 16, kMaxCalls = 64;

inline bool operator==(const vyr_role_t &a, const vyr_role_t &b)
{
	return std::tie(a.id, a.attr, a.rights) == std::tie(b.id, b.attr, b.rights);
}

// A label by value.  A get fills the label if it fits the room offered, else
// answers E2BIG with these sizes.  What lies past the sizes stays zero.
struct Label {
	uint8_t lev = 0, ilev = 0;
	uint64_t cat = 0;
	uint16_t type = 0;
	uint32_t blob_size = 0, nroles1 = 0, nroles2 = 0;
	uint8_t blob[kMaxBlob] = {};
	vyr_role_t roles1[kMaxRoles] = {}, roles2[kMaxRoles] = {};
	bool operator==(const Label &) const = default;
};

Label capture(const vyrl_t *l); // contents cut to the room above

inline bool is_get(int cmd)
{
	return cmd == TAVREL_CMD_GET_PID || cmd == TAVREL_CMD_GET_FD || cmd == TAVREL_CMD_GET_PATH ||
	       cmd == TAVREL_CMD_GET_LPATH;
}

// One command as the service saw it.
struct Call {
	int cmd = 0;
	uint64_t target = 0;               // the argument record's first word, raw
	const vyrl_t *label = nullptr;     // the record sent
	std::array<uint32_t, 3> offered{}; // blob_size, nroles1, nroles2 on arrival
	std::size_t room[3] = {};          // usable size of blob, roles1, roles2 (0 for NULL)
	std::array<uint32_t, 3> asked{};   // the sizes on return: what an E2BIG asks for
	Label sent;                        // set commands: the label as read
};

// The script, which tests set, and the log, which they read.  `svc = {}`
// gives a service that opens, holds the all-zero label and fails nothing.
struct Service {
	std::vector<Label> labels; // gets report labels[now] (none: all zero), the last one past the end
	std::vector<int> errs;     // the next commands fail with these errno values, touching nothing (0: run)
	int open_err = 0;          // tavrel_open fails with this errno, unless 0
	int set_rc = 0;            // what sets return; a result other than 0 comes with EPERM
	int opens = 0, closes = 0;
	std::size_t now = 0, next_err = 0, ncalls = 0; // `now` moves on at each E2BIG: the label grew
	Call calls[kMaxCalls] = {}; // a command past these fails with EOVERFLOW
};

extern Service svc;

} // namespace kdouble
