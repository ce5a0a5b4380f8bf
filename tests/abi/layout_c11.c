/* The public headers compile as strict C11, and the records have the same
 * layout seen from C as from the C++ inside of the library. */
#include <stddef.h>
#include <vyr.h>

_Static_assert(sizeof(vyrl_t) == 24, "vyrl_t");
_Static_assert(offsetof(vyrl_t, rl) == 8, "vyrl_t.rl");
_Static_assert(offsetof(vyrl_t, ucnt) == 16, "vyrl_t.ucnt");
_Static_assert(sizeof(vyrml_t) == 40, "vyrml_t");
_Static_assert(offsetof(vyrml_t, cat) == 8, "vyrml_t.cat");
_Static_assert(offsetof(vyrml_t, blob) == 24, "vyrml_t.blob");
_Static_assert(offsetof(vyrml_t, ucnt) == 32, "vyrml_t.ucnt");
_Static_assert(sizeof(vyrrl_t) == 32, "vyrrl_t");
_Static_assert(offsetof(vyrrl_t, roles2) == 16, "vyrrl_t.roles2");
_Static_assert(sizeof(vyr_role_t) == 16, "vyr_role_t");
_Static_assert(offsetof(vyr_role_t, rights) == 12, "vyr_role_t.rights");

int vyr_abi_layout_c11(void)
{
	return (int)sizeof(vyrl_t);
}
