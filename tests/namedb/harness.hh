// Test harness of the name database tests.
//
// - A stand-in for the database configuration, defined in the test program
//   itself so that libvyr binds to it: each test sets the back-end names and
//   charsets it wants, can make dbroute_init fail, and counts its calls.
// - Access to the in-memory test plug-ins (tests/namedb/plugins) through
//   their control interface.
// - in_fresh_process(): runs a test body in a forked child, because a
//   database's start-up state lasts for the life of a process.
#pragma once

#include <vyr/namedb.h>

#include <cstdint>
#include <functional>
#include <string>

namespace nd_test {

enum class Table { mac = 0, lev = 1, cat = 2 };

// ---- configuration stand-in ----

// How many times libvyr called dbroute_init, and what it answers
// (negative: failure with errno EIO).
extern int g_init_calls;
extern int g_init_result;

// Sets one text field of the configuration block by its field name
// ("lev_backend", "cat_charset", ...). Values longer than the field abort.
void configure(const std::string &field, const std::string &value);
void configure_default_entry(uint32_t on);

// Points all three databases at `backend`, with the given charset.
void configure_all(const std::string &backend, const std::string &charset);

// ---- test plug-ins ----

class Plugin {
public:
	// Loads libtavrel-mac-db-<backend>.so.2 from the build's lib directory.
	explicit Plugin(const std::string &backend);

	void reset() const;
	void knob(const char *key, long long value) const;
	void add_mac(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2,
		     long long uid = -1) const;
	void add_lev(const char *name, unsigned value) const;
	void add_cat(const char *name, uint64_t value) const;
	std::string log() const;
	void clear_log() const;
	long live_handles() const;
	size_t rows(Table t) const;

private:
	void *sym(const char *entry) const;
	void *dl_;
	std::string backend_;
};

// Whether libvyr has loaded the plug-in of `backend` by its bare file name.
bool plugin_loaded(const std::string &backend);

// ---- processes and output ----

// Runs body in a forked child and expects it to finish without a test
// failure. Failures inside the child are printed by the child itself.
void in_fresh_process(const std::function<void()> &body);

// Runs body with stderr sent to a temporary file and returns what it wrote.
std::string capture_stderr(const std::function<void()> &body);

// Sets a UTF-8 locale for the process (the locale charset the databases
// note at start-up).
void use_utf8_locale();

// The bytes of `text` in KOI8-R, for checking conversions.
std::string to_koi8r(const std::string &utf8);

} // namespace nd_test
