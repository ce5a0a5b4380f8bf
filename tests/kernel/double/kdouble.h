// A scripted stand-in for the kernel's label service, for tests.
//
// libkdouble.so defines tavrel_open, tavrel_close and tavrel_syscall_ioctl.
// Linked into a test program ahead of libvyr.so.2, it is found before the
// real service library, so every command the library sends lands here.  It
// behaves as the service does (fills a label that fits, answers E2BIG with
// the sizes it needs otherwise) and can be told to misbehave: fail the open,
// fail commands with a chosen errno, or grow its label after each E2BIG.
//
// It records every call: command number, the raw 64-bit target word, the
// room offered, the size of each buffer offered, and for set commands a copy
// of the label sent.  Nothing here allocates while a command runs, so the
// failing allocator only ever hits the library under test.
#pragma once

#include <vyr/types.h>

#include <cstddef>
#include <cstdint>
#include <initializer_list>

namespace kdouble {

constexpr std::size_t kMaxBlob = 256;
constexpr std::size_t kMaxRoles = 32;
constexpr std::size_t kMaxCalls = 128;
constexpr std::size_t kMaxGrowth = 8;
constexpr std::size_t kMaxFailures = 64;

// A label by value, with room for what the tests need.
struct Label {
    uint8_t lev = 0;
    uint8_t ilev = 0;
    uint64_t cat = 0;
    uint16_t type = 0;
    uint32_t blob_size = 0;
    uint8_t blob[kMaxBlob] = {};
    uint32_t nroles1 = 0;
    uint32_t nroles2 = 0;
    vyr_role_t roles1[kMaxRoles] = {};
    vyr_role_t roles2[kMaxRoles] = {};
};

Label make_label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type,
                 std::initializer_list<uint8_t> blob = {},
                 std::initializer_list<vyr_role_t> roles1 = {},
                 std::initializer_list<vyr_role_t> roles2 = {});

// What one call of tavrel_syscall_ioctl saw.
struct Call {
    int cmd = 0;
    uint64_t target = 0;          // the argument record's first word, as sent
    const vyrl_t *label = nullptr;
    // Room offered in the label when the command arrived.
    uint32_t blob_size = 0;
    uint32_t nroles1 = 0;
    uint32_t nroles2 = 0;
    // Usable size of each buffer offered (0 for NULL).  Exact under
    // AddressSanitizer, rounded up by the plain allocator.
    std::size_t blob_room = 0;
    std::size_t roles1_room = 0;
    std::size_t roles2_room = 0;
    Label sent;                   // set commands: the label as read
    int result = 0;
    int err = 0;                  // errno left, when result != 0
};

// Back to a service that opens fine and holds the all-zero label, with an
// empty log and no scripted failures.
void reset();

// The label that get commands report.
void set_label(const Label &label);
const Label &label();

// After each E2BIG answer the next of these replaces the label, as if it had
// grown between two passes.
void grow_after_e2big(std::initializer_list<Label> labels);

// tavrel_open fails with this errno (0: it succeeds).
void fail_open(int err);

// The next commands fail, in order, with these errno values, touching
// nothing; an E2BIG here leaves the sizes in the label as they are.  A 0
// lets that command run as usual.
void fail_commands(std::initializer_list<int> errs);

// Result of set commands that are not failed otherwise (default 0).  A set
// command that succeeds replaces the service's label by the one sent.
void set_result(int rc);

std::size_t call_count();
const Call &call(std::size_t i);
int open_count();
int close_count();

}  // namespace kdouble
