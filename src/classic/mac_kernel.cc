// The older kernel calls and the conversions between mac_t and the two small
// records of that interface.
//
// Nothing here talks to the kernel directly.  Every setter fetches the whole
// label, changes level, categories and (for files) the "ehole" flag in place,
// and writes that same label back, so that the integrity level, the other
// flags, the byte string and the role lists are carried through untouched.

#include <vyr/classic.h>
#include <vyr/kernel.h>
#include <vyr/label.h>

#include "classic/mac_bits.hh"

#include <cerrno>
#include <cstdlib>
#include <memory>

namespace vyr::classic {
namespace {

// Owner of the one reference a getter hands out.
struct LabelPut {
    void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
};
using Label = std::unique_ptr<vyrl_t, LabelPut>;

struct MacFree {
    void operator()(mac_t *m) const noexcept { mac_free(m); }
};
using Mac = std::unique_ptr<mac_t, MacFree>;

// The kernel knows all six waivers as one flag: only the full set maps to it.
constexpr bool waives_all(uint32_t type_low) noexcept {
    return (type_low & TAVREL_MAC_ALL_WAIVERS) == TAVREL_MAC_ALL_WAIVERS;
}

void apply_waivers(vyrl_t *l, uint32_t type_low) noexcept {
    if (waives_all(type_low))
        vyrl_or_type(l, VYR_TYPE_EHOLE);
    else
        vyrl_and_type(l, static_cast<uint16_t>(~VYR_TYPE_EHOLE));
}

uint32_t waivers_of(const vyrl_t *l) noexcept {
    return (vyrl_type(l) & VYR_TYPE_EHOLE) ? TAVREL_MAC_ALL_WAIVERS : 0;
}

// Fetch, change, write back.  Returns the writer's result unchanged, or -1
// when the label could not be fetched.
template <class Target, class Change>
int update(Target target, vyrl_t *(*get)(Target), int (*set)(Target, vyrl_t *), Change change) noexcept {
    Label l{get(target)};
    if (!l) return -1;
    change(l.get());
    return set(target, l.get());
}

template <class Target>
int chmac(Target target, vyrl_t *(*get)(Target), int (*set)(Target, vyrl_t *),
          const tavrel_mac_label_t *label) noexcept {
    return update(target, get, set, [label](vyrl_t *l) {
        vyrl_set_lev(l, label->mac.lev);
        vyrl_set_cat(l, label->mac.cat);
        apply_waivers(l, label->type_low);
    });
}

template <class Target>
int statmac(Target target, vyrl_t *(*get)(Target), tavrel_mac_label_t *label) noexcept {
    Label l{get(target)};
    if (!l) return -1;
    label->mac.lev = vyrl_lev(l.get());
    label->mac.cat = vyrl_cat(l.get());
    label->type_low = waivers_of(l.get());
    return 0;
}

// The record that waives everything at level 0 with no categories.
constexpr tavrel_mac_label_t kIgnore = {TAVREL_MAC_ALL_WAIVERS, {0, 0}};

int flatten(int rc) noexcept { return rc == 0 ? 0 : -1; }

// A new object value from a file record: its waivers over the object class.
mac_t *object_from(const tavrel_mac_label_t &rec) noexcept {
    Mac m{mac_init(MAC_CLASS_OBJECT)};
    if (!m) return nullptr;
    mac_set_lev(m.get(), rec.mac.lev);
    mac_set_cat(m.get(), rec.mac.cat);
    // The class is an object's, so the setter cannot refuse.
    (void)mac_set_type(m.get(), waivers(rec.type_low) | MAC_CLASS_OBJECT);
    return m.release();
}

bool is_object(const mac_t *m) noexcept { return m && mac_class(m->type) == MAC_CLASS_OBJECT; }

tavrel_mac_label_t file_record(const mac_t *m) noexcept {
    tavrel_mac_label_t rec{};
    mac_t_to_tavrel_mac_label_t(m, &rec);
    return rec;
}

// Reads a text into a private subject value and, on success only, hands it
// to `fill`.
template <class Fill>
int from_text(const char *text, Fill fill) noexcept {
    Mac m{mac_init(MAC_CLASS_SUBJECT)};
    if (!m) return -1;
    if (mac_from_text(m.get(), text) != 0) return -1;
    fill(m.get());
    return 0;
}

char *to_text(mac_t *m, int flags) noexcept {
    Mac owned{m};
    return owned ? mac_to_text(owned.get(), nullptr, flags) : nullptr;
}

}  // namespace
}  // namespace vyr::classic

using namespace vyr::classic;

extern "C" {

// ---- records <-> kernel --------------------------------------------------

int tavrel_chmac(const char *path, const tavrel_mac_label_t *label) noexcept {
    return chmac(path, vyr_get_path, vyr_set_path, label);
}

int tavrel_fchmac(int fd, const tavrel_mac_label_t *label) noexcept {
    return chmac(fd, vyr_get_fd, vyr_set_fd, label);
}

int tavrel_statmac(const char *path, tavrel_mac_label_t *label) noexcept {
    return statmac(path, vyr_get_path, label);
}

int tavrel_fstatmac(int fd, tavrel_mac_label_t *label) noexcept { return statmac(fd, vyr_get_fd, label); }

int tavrel_setmac(int pid, const tavrel_mac_t *mac) noexcept {
    // A process's flags are left alone: there are no waivers to carry.
    return update(pid, vyr_get_pid, vyr_set_pid, [mac](vyrl_t *l) {
        vyrl_set_lev(l, mac->lev);
        vyrl_set_cat(l, mac->cat);
    });
}

int tavrel_getmac(int pid, tavrel_mac_t *mac) noexcept {
    Label l{vyr_get_pid(pid)};
    if (!l) return -1;
    mac->lev = vyrl_lev(l.get());
    mac->cat = vyrl_cat(l.get());
    return 0;
}

int tavrel_chmac_ign(const char *path) noexcept { return flatten(tavrel_chmac(path, &kIgnore)); }

int tavrel_fchmac_ign(int fd) noexcept { return flatten(tavrel_fchmac(fd, &kIgnore)); }

// ---- mac_t <-> kernel ----------------------------------------------------

mac_t *mac_get_pid(int pid) noexcept {
    tavrel_mac_t rec{};
    if (tavrel_getmac(pid, &rec) != 0) return nullptr;
    mac_t *m = mac_init(MAC_CLASS_SUBJECT);
    if (!m) return nullptr;
    mac_set_lev(m, rec.lev);
    mac_set_cat(m, rec.cat);
    (void)mac_set_type(m, MAC_TYPE_SUBJECT);
    return m;
}

int mac_set_pid(int pid, const mac_t *m) noexcept {
    if (!m || mac_class(m->type) != MAC_CLASS_SUBJECT) {
        errno = EINVAL;
        return -1;
    }
    tavrel_mac_t rec{};
    mac_t_to_tavrel_mac_t(m, &rec);
    return tavrel_setmac(pid, &rec);
}

mac_t *mac_get_file(const char *path) noexcept {
    if (!path) {
        errno = EINVAL;
        return nullptr;
    }
    tavrel_mac_label_t rec{};
    if (tavrel_statmac(path, &rec) != 0) return nullptr;
    return object_from(rec);
}

mac_t *mac_get_fd(int fd) noexcept {
    tavrel_mac_label_t rec{};
    if (tavrel_fstatmac(fd, &rec) != 0) return nullptr;
    return object_from(rec);
}

int mac_set_file(const char *path, const mac_t *m) noexcept {
    if (!path || !is_object(m)) {
        errno = EINVAL;
        return -1;
    }
    tavrel_mac_label_t rec = file_record(m);
    return tavrel_chmac(path, &rec);
}

int mac_set_fd(int fd, const mac_t *m) noexcept {
    if (!is_object(m)) {
        errno = EINVAL;
        return -1;
    }
    tavrel_mac_label_t rec = file_record(m);
    return tavrel_fchmac(fd, &rec);
}

// ---- conversions -----------------------------------------------------------

mac_t *tavrel_mac_t_to_mac_t(const tavrel_mac_t *mac, uint32_t type) noexcept {
    mac_t *m = mac_init(type);
    if (!m) return nullptr;
    mac_set_lev(m, mac->lev);
    mac_set_cat(m, mac->cat);
    return m;
}

void mac_t_to_tavrel_mac_t(const mac_t *m, tavrel_mac_t *mac) noexcept {
    mac->lev = mac_get_lev(m);
    mac->cat = mac_get_cat(m);
}

mac_t *tavrel_mac_label_t_to_mac_t(const tavrel_mac_label_t *label) noexcept {
    return tavrel_mac_t_to_mac_t(&label->mac, label->type_low | MAC_CLASS_OBJECT);
}

void mac_t_to_tavrel_mac_label_t(const mac_t *m, tavrel_mac_label_t *label) noexcept {
    mac_t_to_tavrel_mac_t(m, &label->mac);
    label->type_low = waivers(mac_get_type(m));
}

char *tavrel_mac_t_to_text(const tavrel_mac_t *mac, uint32_t type, int flags) noexcept {
    return to_text(tavrel_mac_t_to_mac_t(mac, type), flags);
}

char *tavrel_mac_label_t_to_text(const tavrel_mac_label_t *label, int flags) noexcept {
    return to_text(tavrel_mac_label_t_to_mac_t(label), flags);
}

int tavrel_mac_t_from_text(tavrel_mac_t *mac, const char *text) noexcept {
    return from_text(text, [mac](const mac_t *m) { mac_t_to_tavrel_mac_t(m, mac); });
}

int tavrel_mac_label_t_from_text(tavrel_mac_label_t *label, const char *text) noexcept {
    return from_text(text, [label](const mac_t *m) { mac_t_to_tavrel_mac_label_t(m, label); });
}

}  // extern "C"
