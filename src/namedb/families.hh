// The handle-based functions of each database gathered in one type, so that
// the static-result and wide-character layers can be written once as
// templates over the database.
#pragma once

#include <vyr/namedb.h>

#include <cstdint>

namespace vyr::namedb {

struct MacFamily {
	using Entry = macent_t;
	using Key = uint32_t;
	static constexpr auto open = openmacdb_r;
	static constexpr auto close = closemacdb_r;
	static constexpr auto set = setmacent_r;
	static constexpr auto end = endmacent_r;
	static constexpr auto getent = getmacent_r;
	static constexpr auto getnam = getmacnam_r;
	static constexpr auto getkey = getmacuid_r;
	static constexpr auto put = putmacent_r;
	static constexpr auto rmnam = rmmacnam_r;
	static constexpr auto fget = fgetmacent_r;
	static constexpr auto fput = fputmacent_r;
};

struct LevFamily {
	using Entry = levent_t;
	using Key = int;
	static constexpr auto open = openlevdb_r;
	static constexpr auto close = closelevdb_r;
	static constexpr auto set = setlevent_r;
	static constexpr auto end = endlevent_r;
	static constexpr auto getent = getlevent_r;
	static constexpr auto getnam = getlevnam_r;
	static constexpr auto getkey = getlevval_r;
	static constexpr auto put = putlevent_r;
	static constexpr auto rmnam = rmlevnam_r;
	static constexpr auto rmkey = rmlevval_r;
	static constexpr auto fget = fgetlevent_r;
	static constexpr auto fput = fputlevent_r;
};

struct CatFamily {
	using Entry = catent_t;
	using Key = uint64_t;
	static constexpr auto open = opencatdb_r;
	static constexpr auto close = closecatdb_r;
	static constexpr auto set = setcatent_r;
	static constexpr auto end = endcatent_r;
	static constexpr auto getent = getcatent_r;
	static constexpr auto getnam = getcatnam_r;
	static constexpr auto getkey = getcatval_r;
	static constexpr auto put = putcatent_r;
	static constexpr auto rmnam = rmcatnam_r;
	static constexpr auto rmkey = rmcatval_r;
	static constexpr auto fget = fgetcatent_r;
	static constexpr auto fput = fputcatent_r;
};

} // namespace vyr::namedb
