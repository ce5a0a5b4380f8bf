// Writers of the single label fields and of the role part.
//
// Level and category names come from the name databases.  Nothing is kept
// between calls: every conversion that needs a name opens the database,
// looks the value up and closes it again.
#include "repr/text_grammar.hh"
#include "repr/text_out.hh"

#include <vyr/namedb.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <memory>

namespace vyr::repr {
namespace {

constexpr bool has(int flags, int bit) noexcept { return (flags & bit) != 0; }

// Sums the bytes of a run of appends.  The first failed append makes the
// result -1 for good and turns every later append into a no-op, so a writer
// can issue its appends in a row and read the outcome once.
class Appender {
public:
	explicit Appender(struct obstack *o) noexcept : o_(o) {}

	[[gnu::format(printf, 2, 3)]] bool add(const char *fmt, ...) noexcept
	{
		if (count_ < 0)
			return false;
		va_list ap;
		va_start(ap, fmt);
		int n = ::obstack_vprintf(o_, fmt, ap);
		va_end(ap);
		count_ = n < 0 ? -1 : count_ + n;
		return n >= 0;
	}

	// A fixed word, translated at this very use, written as it stands.
	bool word(const char *msgid) noexcept { return add("%s", translated(msgid)); }

	int result() const noexcept { return count_; }

private:
	struct obstack *o_;
	int count_ = 0;
};

// An open database handle, closed when it goes out of scope.
template <int (*Close)(void *)>
class Database {
public:
	explicit Database(void *h) noexcept : h_(h) {}
	Database(const Database &) = delete;
	Database &operator=(const Database &) = delete;
	~Database()
	{
		if (h_ != nullptr)
			Close(h_);
	}
	explicit operator bool() const noexcept { return h_ != nullptr; }
	void *get() const noexcept { return h_; }

private:
	void *h_;
};

using LevelDb = Database<closelevdb_r>;
using CategoryDb = Database<closecatdb_r>;

template <class T, void (*Free)(T *)>
struct EntryFree {
	void operator()(T *e) const noexcept { Free(e); }
};
using LevelEntry = std::unique_ptr<levent_t, EntryFree<levent_t, freelevent_r>>;
using CategoryEntry = std::unique_ptr<catent_t, EntryFree<catent_t, freecatent_r>>;

int append_mask(struct obstack *o, std::uint64_t mask) noexcept
{
	return obstack_printf(o, "0x%lx", static_cast<unsigned long>(mask));
}

// A level or integrity level as a new string of decimal digits.
char *number_text(unsigned value) noexcept
{
	char buf[sizeof "4294967295"];
	std::snprintf(buf, sizeof buf, "%u", value);
	return copy_text(buf);
}

// Category mask 0 is looked up as a value of its own.
int write_zero_category(const CategoryDb &db, struct obstack *o, bool named_only) noexcept
{
	CategoryEntry e{getcatval_r(db.get(), 0)};
	if (e)
		return obstack_printf(o, "%s", e->name);
	if (named_only)
		return -1;
	return obstack_printf(o, "0x0");
}

// One pass over the category database for the whole mask.  An entry is
// written when it is non-zero and every one of its bits is still unclaimed;
// it then claims them.  So entries earlier in the database win shared bits,
// and an entry that lost any bit is not written at all.
int write_category_names(const CategoryDb &db, std::uint64_t cat, struct obstack *o,
                         bool named_only) noexcept
{
	if (setcatent_r(db.get()) != 0)
		return -1;
	Appender out(o);
	std::uint64_t remaining = cat;
	bool named = false;
	while (remaining != 0) {
		CategoryEntry e{getcatent_r(db.get())};
		if (!e)
			break;
		if (e->value == 0 || (e->value & ~remaining) != 0)
			continue;
		if (!out.add(named ? ",%s" : "%s", e->name))
			return -1; // the walk is abandoned; the handle still gets closed
		named = true;
		remaining &= ~e->value;
	}
	endcatent_r(db.get());
	if (remaining != 0) {
		if (named_only)
			return -1;
		out.add(named ? ",0x%lx" : "0x%lx", static_cast<unsigned long>(remaining));
	}
	return out.result();
}

void append_role_ids(Appender &out, const vyr_role_t *roles, std::uint32_t n) noexcept
{
	for (std::uint32_t i = 0; i < n; ++i)
		out.add(i == 0 ? "%ld" : ",%ld", static_cast<long>(roles[i].id));
}

// A count without an array cannot be printed; it reads as an empty list.
bool list_empty(const vyr_role_t *roles, std::uint32_t n) noexcept
{
	return n == 0 || roles == nullptr;
}

} // namespace
} // namespace vyr::repr

using namespace vyr::repr;

extern "C" {

int vyr_lev_obstack(uint8_t lev, struct obstack *o, int flags) noexcept
{
	if (has(flags, VYR_TEXT_OMIT_ZERO) && lev == 0)
		return 0;
	if (has(flags, VYR_TEXT_NUMERIC))
		return obstack_printf(o, "%u", unsigned{lev});
	LevelDb db{openlevdb_r()};
	if (!db)
		return -1; // no quiet fallback to the number here
	LevelEntry e{getlevval_r(db.get(), lev)};
	if (e)
		return obstack_printf(o, "%s", e->name);
	if (has(flags, VYR_TEXT_NAMED_ONLY))
		return -1;
	return obstack_printf(o, "%u", unsigned{lev});
}

// Unlike the obstack writer: a name always wins, VYR_TEXT_NUMERIC is not
// consulted, and an unnamed level is NULL only for a flag word of 0.
char *vyr_lev_get_text(uint8_t lev, int flags) noexcept
{
	if (has(flags, VYR_TEXT_OMIT_ZERO) && lev == 0)
		return copy_text("");
	LevelDb db{openlevdb_r()};
	if (!db)
		return nullptr;
	LevelEntry e{getlevval_r(db.get(), lev)};
	if (e)
		return copy_text(e->name);
	if (flags == 0)
		return nullptr;
	return number_text(lev);
}

int vyr_ilev_obstack(uint8_t ilev, struct obstack *o, int flags) noexcept
{
	if (has(flags, VYR_TEXT_NUMERIC))
		return obstack_printf(o, "%hhu", ilev);
	if (ilev <= 1)
		return obstack_printf(o, "%s", translated(ilev == 0 ? word_low : word_high));
	if (has(flags, VYR_TEXT_NAMED_ONLY))
		return -1;
	return obstack_printf(o, "%hhu", ilev);
}

// Unlike the obstack writer, 0 and 1 are always words.
char *vyr_ilev_get_text(uint8_t ilev, int flags) noexcept
{
	if (ilev <= 1)
		return copy_text(translated(ilev == 0 ? word_low : word_high));
	if (has(flags, VYR_TEXT_NAMED_ONLY))
		return nullptr;
	return number_text(ilev);
}

int vyr_cat_obstack(uint64_t cat, struct obstack *o, int flags) noexcept
{
	const bool named_only = has(flags, VYR_TEXT_NAMED_ONLY);
	if (has(flags, VYR_TEXT_NUMERIC))
		return append_mask(o, cat);
	CategoryDb db{opencatdb_r()};
	if (!db)
		return named_only ? -1 : append_mask(o, cat);
	if (cat == 0)
		return write_zero_category(db, o, named_only);
	return write_category_names(db, cat, o, named_only);
}

char *vyr_cat_get_text(uint64_t cat, int flags) noexcept
{
	return build_text([&](struct obstack *o) { return vyr_cat_obstack(cat, o, flags); });
}

int vyr_type_obstack(uint16_t type, struct obstack *o, int flags) noexcept
{
	if (has(flags, VYR_TEXT_NUMERIC))
		return obstack_printf(o, "0x%x", unsigned{type});
	for (const TypeName &c : type_composites)
		if (type == c.value)
			return obstack_printf(o, "%s", c.name);
	Appender out(o);
	unsigned remaining = type;
	bool named = false;
	for (const TypeName &b : type_bits) {
		if ((remaining & b.value) == 0)
			continue;
		out.add(named ? ",%s" : "%s", b.name);
		named = true;
		remaining &= ~unsigned{b.value};
	}
	if (!named)
		out.add("0x%x", remaining); // also how 0 reads "0x0"
	else if (remaining != 0)
		out.add(",0x%x", remaining);
	return out.result();
}

char *vyr_type_get_text(uint16_t type, int flags) noexcept
{
	return build_text([&](struct obstack *o) { return vyr_type_obstack(type, o, flags); });
}

int vyrrl_obstack(const vyrrl_t *rl, struct obstack *o, int flags) noexcept
{
	const bool numeric = has(flags, VYR_TEXT_NUMERIC);
	const bool omit = has(flags, VYR_TEXT_OMIT_ZERO);
	Appender out(o);
	if (!list_empty(rl->roles1, rl->nroles1))
		append_role_ids(out, rl->roles1, rl->nroles1);
	else if (!numeric && !omit)
		out.word(word_no);

	if (!list_empty(rl->roles2, rl->nroles2)) {
		out.add(":");
		append_role_ids(out, rl->roles2, rl->nroles2);
	} else if (numeric) {
		out.add(":");
	} else if (!omit) {
		out.word(word_colon_no);
	}
	return out.result();
}

char *vyrrl_get_text(const vyrrl_t *rl, int flags) noexcept
{
	return build_text([&](struct obstack *o) { return vyrrl_obstack(rl, o, flags); });
}

} // extern "C"
