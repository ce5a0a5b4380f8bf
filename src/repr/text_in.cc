// Label text readers: single fields, role lists, mandatory parts, role parts
// and whole labels, read back from the text that the writers produce.
//
// Every reader is lenient in the same ways: names and numbers are both
// accepted (a name is always tried first), absent trailing fields read as 0,
// and NULL or an empty text reads as the all-zero label. The numbers are read
// with sscanf/strtoul/strtoull exactly, because their forgiving handling of
// blanks, signs, trailing junk and overflow is part of the text grammar that
// applications rely on ("12abc" is level 12, "300" is level 44).
//
// Forms: a reader ending in _nc cuts the caller's text in place by writing NUL
// bytes over separators; the other record and list readers work on a private
// strdup copy. Which separators a function cuts is part of its contract, so
// each piece below cuts exactly the separators it owns and no other.
//
// Nothing is cached: every call opens the level or category database for
// itself and closes it again before it returns.
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/text.h>

#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <optional>
#include <string_view>

#include "common/c_api.hh"
#include "repr/text_grammar.hh"

namespace vyr::repr {
namespace {

using CString = malloc_ptr<char>;

struct MlPut {
	void operator()(vyrml_t *ml) const noexcept { vyrml_put(ml); }
};
struct RlPut {
	void operator()(vyrrl_t *rl) const noexcept { vyrrl_put(rl); }
};
using MlRef = std::unique_ptr<vyrml_t, MlPut>;
using RlRef = std::unique_ptr<vyrrl_t, RlPut>;

// ---- text helpers --------------------------------------------------------

bool is_empty(const char *text) noexcept
{
	return text == nullptr || *text == '\0';
}

// Writes a NUL over the first `sep` in text and returns the text behind it,
// or nullptr when text holds no `sep` (and is then left as it was).
char *split_at(char *text, char sep) noexcept
{
	char *at = std::strchr(text, sep);
	if (at == nullptr)
		return nullptr;
	*at = '\0';
	return at + 1;
}

char *skip_commas(char *text) noexcept
{
	while (*text == ',')
		++text;
	return text;
}

// A fixed word matches in its translated form (looked up afresh each time, as
// the writers do) and in its plain form, which is accepted in every locale so
// that text written under one locale can still be read under another.
bool is_fixed_word(const char *text, const char *word) noexcept
{
	return std::strcmp(text, translated(word)) == 0 || std::strcmp(text, word) == 0;
}

// ---- number readers --------------------------------------------------------

// Decimal byte as "%hhu" takes it: blanks and a sign, digits up to the first
// other character, stored modulo 256.
bool scan_byte(const char *text, uint8_t *out) noexcept
{
	return std::sscanf(text, "%hhu", out) == 1;
}

// Hexadecimal category token: the whole token must be taken, and only an
// overflow is refused. errno is left as the caller had it unless the token
// overflows, when strtoull's ERANGE stays.
bool scan_cat_number(const char *token, uint64_t *out) noexcept
{
	const int saved = errno;
	errno = 0;
	char *end = nullptr;
	const unsigned long long value = std::strtoull(token, &end, 16);
	if (value == ULLONG_MAX && errno == ERANGE)
		return false;
	errno = saved;
	if (*end != '\0')
		return false;
	*out = value;
	return true;
}

// ---- database sessions ---------------------------------------------------

// One open-to-close session of a name database. A database that can't be
// opened is no error for a reader: lookups are then skipped and numbers still
// work. Closing keeps errno, so that a failure reported by a number reader is
// what the caller sees.
template <auto Open, auto Close>
class DbSession {
public:
	using Handle = decltype(Open());

	DbSession() noexcept : handle_(Open()) {}
	~DbSession()
	{
		if (handle_ != Handle{}) {
			const int saved = errno;
			Close(handle_);
			errno = saved;
		}
	}
	DbSession(const DbSession &) = delete;
	DbSession &operator=(const DbSession &) = delete;

	bool open() const noexcept { return handle_ != Handle{}; }
	Handle handle() const noexcept { return handle_; }

private:
	Handle handle_;
};

using LevDb = DbSession<openlevdb_r, closelevdb_r>;
using CatDb = DbSession<opencatdb_r, closecatdb_r>;

// The level entry of `name`, taken with the database already closed again:
// an entry outlives the handle that gave it.
levent_t *find_level(const char *name) noexcept
{
	LevDb db;
	if (!db.open())
		return nullptr;
	return getlevnam_r(db.handle(), name);
}

// ---- categories ------------------------------------------------------------

// ORs one category token into *mask: its database entry when it has one (a
// name beats the number it may also spell), else its hexadecimal value.
bool add_category(const CatDb &db, const char *token, uint64_t *mask) noexcept
{
	if (db.open()) {
		if (catent_t *entry = getcatnam_r(db.handle(), token)) {
			*mask |= entry->value;
			freecatent_r(entry);
			return true;
		}
	}
	uint64_t value = 0;
	if (!scan_cat_number(token, &value))
		return false;
	*mask |= value;
	return true;
}

// Reads a comma list of categories in place; each token is cut at the comma
// behind it. Runs of commas separate like one. *mask is built up as tokens
// are read, so after a failure it holds the bits of the tokens before the
// bad one. One open per call, one lookup per token.
int cat_parse_list(char *text, uint64_t *mask) noexcept
{
	*mask = 0;
	CatDb db;
	char *token = skip_commas(text);
	while (*token != '\0') {
		char *rest = split_at(token, ',');
		if (!add_category(db, token, mask))
			return -1;
		if (rest == nullptr)
			break;
		token = skip_commas(rest);
	}
	return 0;
}

// ---- type ------------------------------------------------------------------

// A type name's value: the composite names are tried first, then the bit
// names, both case sensitive, as the writer chooses among them.
std::optional<uint16_t> type_name_value(std::string_view token) noexcept
{
	for (const TypeName &row : type_composites) {
		if (token == row.name)
			return row.value;
	}
	for (const TypeName &row : type_bits) {
		if (token == row.name)
			return row.value;
	}
	return std::nullopt;
}

// A name ORs into *type; a number replaces it. strtoul's own overflow rule
// stands (an overflowing number reads as all ones), and only the low 16 bits
// are kept, even from a token that turns out bad.
bool apply_type_token(const char *token, uint16_t *type) noexcept
{
	if (const auto value = type_name_value(token)) {
		*type = static_cast<uint16_t>(*type | *value);
		return true;
	}
	char *end = nullptr;
	const unsigned long number = std::strtoul(token, &end, 16);
	*type = static_cast<uint16_t>(number);
	return *end == '\0';
}

// Every comma separates, so empty tokens count: they read as the number 0
// and replace what came before them.
int type_parse_list(char *text, uint16_t *type) noexcept
{
	*type = 0;
	for (char *token = text; token != nullptr;) {
		char *rest = split_at(token, ',');
		if (!apply_type_token(token, type))
			return -1;
		token = rest;
	}
	return 0;
}

// The copying form of a list reader: an empty text is 0 and opens nothing; a
// failed copy leaves *out untouched.
template <class T, int (*Parse)(char *, T *)>
int read_list_copy(const char *text, T *out) noexcept
{
	if (is_empty(text)) {
		*out = 0;
		return 0;
	}
	CString copy(strdup(text));
	if (!copy)
		return -1;
	return Parse(copy.get(), out);
}

// ---- records ---------------------------------------------------------------

// "lev:ilev:cat:type" in place. Only the three field separators are cut; the
// cat and type fields go through the copying readers, so their commas stay.
// Fields that are absent keep the 0 of the new record.
vyrml_t *parse_mandatory(char *text) noexcept
{
	MlRef ml(vyrml_get_new());
	if (!ml)
		return nullptr;
	char *ilev = split_at(text, ':');
	if (vyr_lev_from_text(text, &ml->lev) != 0)
		return nullptr;
	if (ilev == nullptr)
		return ml.release();
	char *cat = split_at(ilev, ':');
	if (vyr_ilev_from_text(ilev, &ml->ilev) != 0)
		return nullptr;
	if (cat == nullptr)
		return ml.release();
	// Whatever follows the third ':' is the type text, further ':' included.
	char *type = split_at(cat, ':');
	if (vyr_cat_from_text(cat, &ml->cat) != 0)
		return nullptr;
	if (vyr_type_from_text(type, &ml->type) != 0)
		return nullptr;
	return ml.release();
}

// "roles1:roles2" in place. Only the first ':' separates; a later one ends
// the number before it in the second list.
vyrrl_t *parse_role_part(char *text) noexcept
{
	RlRef rl(vyrrl_get_new());
	if (!rl)
		return nullptr;
	char *second = split_at(text, ':');
	if (vyr_roles_from_text(text, &rl->roles1, &rl->nroles1) != 0)
		return nullptr;
	if (vyr_roles_from_text(second, &rl->roles2, &rl->nroles2) != 0)
		return nullptr;
	return rl.release();
}

// "mandatory!roles" in place; either side may be empty and the role side
// absent, which both read as the zero label's part.
vyrl_t *parse_label(char *text) noexcept
{
	char *roles = split_at(text, '!');
	MlRef ml(vyrml_get_from_text_nc(text));
	if (!ml)
		return nullptr;
	RlRef rl(vyrrl_get_from_text_nc(roles));
	if (!rl)
		return nullptr;
	vyrl_t *label = vyrl_get_new_init_mr(ml.get(), rl.get());
	if (label == nullptr)
		return nullptr;  // the parts are still ours and go with the guards
	ml.release();
	rl.release();
	return label;
}

vyrml_t *zero_ml() noexcept { return vyrml_dup(VYRL_ZERO->ml); }
vyrrl_t *zero_rl() noexcept { return vyrrl_dup(VYRL_ZERO->rl); }
vyrl_t *zero_label() noexcept { return vyrl_dup(VYRL_ZERO); }

// The two forms of every record reader: an empty text gives a fresh copy of
// the zero label's record; otherwise the in-place form parses the caller's
// text and the copying form a private copy of it.
template <class R, R *(*Zero)(), R *(*Parse)(char *)>
R *read_record_in_place(char *text) noexcept
{
	if (is_empty(text))
		return Zero();
	return Parse(text);
}

template <class R, R *(*Zero)(), R *(*Parse)(char *)>
R *read_record_copy(const char *text) noexcept
{
	if (is_empty(text))
		return Zero();
	CString copy(strdup(text));
	if (!copy)
		return nullptr;
	return Parse(copy.get());
}

} // namespace
} // namespace vyr::repr

using namespace vyr::repr;

extern "C" {

// When the level database can't be opened, a level is still read as a
// number, as categories are: only the name lookup is lost.
int vyr_lev_from_text(const char *text, uint8_t *lev) noexcept
{
	if (is_empty(text)) {
		*lev = 0;
		return 0;
	}
	if (levent_t *entry = find_level(text)) {
		*lev = entry->value;
		freelevent_r(entry);
		return 0;
	}
	return scan_byte(text, lev) ? 0 : -1;
}

int vyr_ilev_from_text(const char *text, uint8_t *ilev) noexcept
{
	if (is_empty(text)) {
		*ilev = 0;
		return 0;
	}
	if (is_fixed_word(text, word_low)) {
		*ilev = 0;
		return 0;
	}
	if (is_fixed_word(text, word_high)) {
		*ilev = 1;
		return 0;
	}
	if (scan_byte(text, ilev))
		return 0;
	errno = EINVAL;
	return -1;
}

int vyr_cat_from_text(const char *text, uint64_t *cat) noexcept
{
	return read_list_copy<uint64_t, cat_parse_list>(text, cat);
}

int vyr_cat_from_text_nc(char *text, uint64_t *cat) noexcept
{
	if (is_empty(text)) {
		*cat = 0;
		return 0;
	}
	return cat_parse_list(text, cat);
}

int vyr_type_from_text(const char *text, uint16_t *type) noexcept
{
	return read_list_copy<uint16_t, type_parse_list>(text, type);
}

int vyr_role_from_text(vyr_role_t *role, const char *text) noexcept
{
	unsigned long id = 0;
	if (!is_empty(text) && !is_fixed_word(text, word_no)) {
		if (std::sscanf(text, "%lu", &id) != 1)
			return -1;  // the role stays as it was
	}
	role->id = id;
	role->attr = 0;
	role->rights = 0;
	return 0;
}

int vyr_roles_from_text(char *text, vyr_role_t **list, uint32_t *count) noexcept
{
	if (is_empty(text) || is_fixed_word(text, word_no)) {
		*list = nullptr;
		*count = 0;
		return 0;
	}
	// One entry per comma-separated token, empty tokens included.
	size_t tokens = 1;
	for (const char *p = text; (p = std::strchr(p, ',')) != nullptr; ++p)
		++tokens;
	if (tokens > UINT32_MAX)
		return -1;  // the count of a role list is 32 bits wide
	vyr::malloc_ptr<vyr_role_t> roles(
		static_cast<vyr_role_t *>(std::calloc(tokens, sizeof(vyr_role_t))));
	if (!roles)
		return -1;
	uint32_t used = 0;
	for (char *token = text; token != nullptr; ++used) {
		char *rest = split_at(token, ',');
		if (vyr_role_from_text(&roles.get()[used], token) != 0)
			return -1;
		token = rest;
	}
	// The array keeps its size; duplicates end up behind the lowered count.
	vyr_roles_normalize(roles.get(), &used);
	*list = roles.release();
	*count = used;
	return 0;
}

vyrml_t *vyrml_get_from_text(const char *text) noexcept
{
	return read_record_copy<vyrml_t, zero_ml, parse_mandatory>(text);
}

vyrml_t *vyrml_get_from_text_nc(char *text) noexcept
{
	return read_record_in_place<vyrml_t, zero_ml, parse_mandatory>(text);
}

vyrrl_t *vyrrl_get_from_text(const char *text) noexcept
{
	return read_record_copy<vyrrl_t, zero_rl, parse_role_part>(text);
}

vyrrl_t *vyrrl_get_from_text_nc(char *text) noexcept
{
	return read_record_in_place<vyrrl_t, zero_rl, parse_role_part>(text);
}

vyrl_t *vyrl_get_from_text(const char *text) noexcept
{
	return read_record_copy<vyrl_t, zero_label, parse_label>(text);
}

vyrl_t *vyrl_get_from_text_nc(char *text) noexcept
{
	return read_record_in_place<vyrl_t, zero_label, parse_label>(text);
}

} // extern "C"
