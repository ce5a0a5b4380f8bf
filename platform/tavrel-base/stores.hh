// Where labels are kept: files carry theirs in an extended attribute,
// processes have records in the state directory.
//
// Readers fill `buf` with the stored form and its length.  They return 0,
// ENODATA when nothing is stored for the target (it then has the all-zero
// label), or another errno value.  Writers return 0 or an errno value.  No
// function here returns E2BIG: that answer belongs to the get commands alone.
#pragma once

#include <cstddef>
#include <cstdint>

#include "byte_buf.hh"
#include "channel.hh"

namespace tavrel {

// `follow` chooses whether a final symbolic link is followed (path commands)
// or acted on itself (link commands).
int read_path_label(const Config &cfg, const char *path, bool follow, ByteBuf &buf, size_t *len) noexcept;
int write_path_label(const Config &cfg, const char *path, bool follow, const uint8_t *data, size_t len) noexcept;
int read_fd_label(const Config &cfg, int fd, ByteBuf &buf, size_t *len) noexcept;
int write_fd_label(const Config &cfg, int fd, const uint8_t *data, size_t len) noexcept;

// Process numbers are taken as given in the command; 0 means the calling
// process, and one that names no process gives ESRCH.
int read_pid_label(const Config &cfg, int64_t pid, ByteBuf &buf, size_t *len) noexcept;
int write_pid_label(const Config &cfg, int64_t pid, const uint8_t *data, size_t len) noexcept;

} // namespace tavrel
