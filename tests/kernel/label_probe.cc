// Reads one label through the kernel calls and prints its whole-label raw
// form in hex, so that a test can check from a second process what the
// first one set.
//
//   kernel_label_probe path|lpath|fd|pid TARGET
//
// Prints the hex form and exits 0, or prints "errno N" and exits 1.

#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/raw.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

vyrl_t *read_label(const char *mode, const char *target) {
    if (std::strcmp(mode, "path") == 0) return vyr_get_path(target);
    if (std::strcmp(mode, "lpath") == 0) return vyr_get_lpath(target);
    if (std::strcmp(mode, "pid") == 0) return vyr_get_pid(std::atoi(target));
    if (std::strcmp(mode, "fd") == 0) {
        const int fd = open(target, O_RDONLY);
        if (fd < 0) return nullptr;
        vyrl_t *l = vyr_get_fd(fd);
        const int saved = errno;
        close(fd);
        errno = saved;
        return l;
    }
    errno = EINVAL;
    return nullptr;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc != 3) {
        std::fprintf(stderr, "usage: %s path|lpath|fd|pid TARGET\n", argv[0]);
        return 2;
    }
    vyrl_t *l = read_label(argv[1], argv[2]);
    if (l == nullptr) {
        std::printf("errno %d\n", errno);
        return 1;
    }
    uint64_t size = 0;
    uint8_t *raw = vyrl_get_raw(l, &size);
    vyrl_put(l);
    if (raw == nullptr) {
        std::printf("errno %d\n", errno);
        return 1;
    }
    for (uint64_t i = 0; i < size; ++i) std::printf("%02x", raw[i]);
    std::printf("\n");
    std::free(raw);
    return 0;
}
