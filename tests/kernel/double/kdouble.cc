// The scripted label service behind the kernel call tests; see kdouble.h.

#include "kdouble.h"

#include "contract/tavrel_base.h"

#include <malloc.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace kdouble {
namespace {

// All state is static and fixed in size: commands must not allocate.
struct State {
    Label label;
    Label growth[kMaxGrowth];
    std::size_t growth_len = 0;
    std::size_t growth_next = 0;
    int failures[kMaxFailures] = {};
    std::size_t failures_len = 0;
    std::size_t failures_next = 0;
    int open_err = 0;
    int set_rc = 0;
    Call calls[kMaxCalls];
    std::size_t ncalls = 0;
    int opens = 0;
    int closes = 0;
};

State &state() {
    static State s;
    return s;
}

bool is_get(int cmd) {
    return cmd == TAVREL_CMD_GET_PID || cmd == TAVREL_CMD_GET_FD || cmd == TAVREL_CMD_GET_PATH ||
           cmd == TAVREL_CMD_GET_LPATH;
}

std::size_t room(const void *p) { return p == nullptr ? 0 : malloc_usable_size(const_cast<void *>(p)); }

// Copies what a set command sends, bounded by the double's own room.
Label read_label(const vyrl_t *l) {
    Label out;
    const vyrml_t *ml = l->ml;
    const vyrrl_t *rl = l->rl;
    out.lev = ml->lev;
    out.ilev = ml->ilev;
    out.cat = ml->cat;
    out.type = ml->type;
    out.blob_size = ml->blob_size;
    if (ml->blob != nullptr) std::memcpy(out.blob, ml->blob, std::min<std::size_t>(ml->blob_size, kMaxBlob));
    out.nroles1 = rl->nroles1;
    out.nroles2 = rl->nroles2;
    if (rl->roles1 != nullptr)
        std::memcpy(out.roles1, rl->roles1, sizeof(vyr_role_t) * std::min<std::size_t>(rl->nroles1, kMaxRoles));
    if (rl->roles2 != nullptr)
        std::memcpy(out.roles2, rl->roles2, sizeof(vyr_role_t) * std::min<std::size_t>(rl->nroles2, kMaxRoles));
    return out;
}

// The service's get: fill a label that fits, else state the sizes needed.
int get(vyrl_t *l) {
    State &s = state();
    const Label &have = s.label;
    vyrml_t *ml = l->ml;
    vyrrl_t *rl = l->rl;
    if (have.blob_size > ml->blob_size || have.nroles1 > rl->nroles1 || have.nroles2 > rl->nroles2) {
        ml->blob_size = have.blob_size;
        rl->nroles1 = have.nroles1;
        rl->nroles2 = have.nroles2;
        if (s.growth_next < s.growth_len) s.label = s.growth[s.growth_next++];
        errno = E2BIG;
        return -1;
    }
    ml->lev = have.lev;
    ml->ilev = have.ilev;
    ml->cat = have.cat;
    ml->type = have.type;
    ml->blob_size = have.blob_size;
    if (have.blob_size != 0) std::memcpy(ml->blob, have.blob, have.blob_size);
    rl->nroles1 = have.nroles1;
    rl->nroles2 = have.nroles2;
    if (have.nroles1 != 0) std::memcpy(rl->roles1, have.roles1, sizeof(vyr_role_t) * have.nroles1);
    if (have.nroles2 != 0) std::memcpy(rl->roles2, have.roles2, sizeof(vyr_role_t) * have.nroles2);
    return 0;
}

}  // namespace

Label make_label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type, std::initializer_list<uint8_t> blob,
                 std::initializer_list<vyr_role_t> roles1, std::initializer_list<vyr_role_t> roles2) {
    Label l;
    l.lev = lev;
    l.ilev = ilev;
    l.cat = cat;
    l.type = type;
    l.blob_size = static_cast<uint32_t>(std::min(blob.size(), kMaxBlob));
    std::copy_n(blob.begin(), l.blob_size, l.blob);
    l.nroles1 = static_cast<uint32_t>(std::min(roles1.size(), kMaxRoles));
    std::copy_n(roles1.begin(), l.nroles1, l.roles1);
    l.nroles2 = static_cast<uint32_t>(std::min(roles2.size(), kMaxRoles));
    std::copy_n(roles2.begin(), l.nroles2, l.roles2);
    return l;
}

void reset() { state() = State{}; }

void set_label(const Label &label) { state().label = label; }

const Label &label() { return state().label; }

void grow_after_e2big(std::initializer_list<Label> labels) {
    State &s = state();
    s.growth_len = std::min(labels.size(), kMaxGrowth);
    s.growth_next = 0;
    std::copy_n(labels.begin(), s.growth_len, s.growth);
}

void fail_open(int err) { state().open_err = err; }

void fail_commands(std::initializer_list<int> errs) {
    State &s = state();
    s.failures_len = std::min(errs.size(), kMaxFailures);
    s.failures_next = 0;
    std::copy_n(errs.begin(), s.failures_len, s.failures);
}

void set_result(int rc) { state().set_rc = rc; }

std::size_t call_count() { return state().ncalls; }

const Call &call(std::size_t i) { return state().calls[i]; }

int open_count() { return state().opens; }

int close_count() { return state().closes; }

}  // namespace kdouble

using namespace kdouble;

extern "C" {

int tavrel_open(void) noexcept {
    State &s = state();
    ++s.opens;
    if (s.open_err != 0) {
        errno = s.open_err;
        return -1;
    }
    return 3;
}

int tavrel_close(void) noexcept {
    ++state().closes;
    return 0;
}

int tavrel_syscall_ioctl(int cmd, vyr_label_cmd_t *arg) noexcept {
    State &s = state();
    // A runaway loop in the library stops here instead of filling the log.
    if (s.ncalls == kMaxCalls) {
        errno = EOVERFLOW;
        return -1;
    }
    Call &c = s.calls[s.ncalls++];
    c = Call{};
    c.cmd = cmd;
    std::memcpy(&c.target, &arg->target, sizeof c.target);
    c.label = arg->label;
    const vyrml_t *ml = arg->label->ml;
    const vyrrl_t *rl = arg->label->rl;
    c.blob_size = ml->blob_size;
    c.nroles1 = rl->nroles1;
    c.nroles2 = rl->nroles2;
    c.blob_room = room(ml->blob);
    c.roles1_room = room(rl->roles1);
    c.roles2_room = room(rl->roles2);

    const int scripted = s.failures_next < s.failures_len ? s.failures[s.failures_next++] : 0;
    if (scripted != 0) {
        c.result = -1;
        c.err = scripted;
    } else if (is_get(cmd)) {
        c.result = get(arg->label);
        c.err = c.result == 0 ? 0 : errno;
    } else {
        c.sent = read_label(arg->label);
        c.result = s.set_rc;
        if (c.result == 0) s.label = c.sent;
        else c.err = EPERM;
    }
    if (c.result != 0) errno = c.err;
    return c.result;
}

}  // extern "C"
