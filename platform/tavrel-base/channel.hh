// The channel's state: whether it is open, and the configuration read when
// it was opened.
#pragma once

namespace tavrel {

// Configuration of an open channel.  Read from the environment by
// tavrel_open and fixed until tavrel_close.
struct Config {
	// Extended attribute that holds a file's label, "<namespace>.vyrlabel".
	const char *attr_name;
	// Directory of the process label records.
	const char *state_dir;
};

// Opens the channel if it is not open: 0, or -1 with errno set.
int channel_open() noexcept;
// Closes the channel; the next open reads the environment again.
void channel_close() noexcept;
// The configuration of the open channel, or nullptr if it is closed.
const Config *channel_config() noexcept;

} // namespace tavrel
