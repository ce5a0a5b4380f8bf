/* The label header used from C11: constants, records and calls with narrow
 * integer arguments across the C interface. */
#include <vyr/label.h>

#include <stddef.h>

_Static_assert(VYR_REQ_EXEC == 1 && VYR_REQ_WRITE == 2 && VYR_REQ_READ == 4 && VYR_REQ_WRITE_UP == 8,
               "access bits");
_Static_assert(VYR_REQ_CHILD == 0x10 && VYR_REQ_OBJ_TYPE == 0x8000, "child and type bits");
_Static_assert(VYR_REQ_NO_LEV == 0x10000 && VYR_REQ_NO_CAT == 0x20000 && VYR_REQ_NO_ILEV == 0x40000,
               "switches");
_Static_assert(VYR_TYPE_CCNRA == 3 && VYR_TYPE_ALL == 7, "composite type bits");

int label_c11_check(void);

/* Returns 0, or the number of the first check that failed. */
int label_c11_check(void)
{
	vyr_role_t roles[2] = {{.id = 1, .attr = 7, .rights = 4}, {.id = 9, .attr = 8, .rights = 2}};
	vyrl_t *l = vyrl_get_new_init_mac_roles(200, 3, 0x8000000000000005ull, 0xFFFF, roles, 2, NULL, 0);
	if (l == NULL)
		return 1;
	int failed = 0;
	if (vyrl_lev(l) != 200 || vyrl_ilev(l) != 3 || vyrl_cat(l) != 0x8000000000000005ull ||
	    vyrl_type(l) != 0xFFFF)
		failed = 2;
	else if (l->rl->nroles1 != 2 || l->rl->roles1[0].id != 9 || l->rl->roles1[1].attr != 7)
		failed = 3;
	else if (vyrl_ucnt(l) != 1 || vyrl_get(l) != l || vyrl_ucnt(l) != 2)
		failed = 4;
	vyrl_put(l);

	vyrl_t *copy = vyrl_dup(VYRL_EQU);
	if (copy == NULL)
		return failed ? failed : 5;
	if (!failed && (vyrl_type(copy) != VYR_TYPE_EHOLE || vyrl_cmp(copy, VYRL_EQU, 0) != 1))
		failed = 6;
	else if (!failed && vyrl_permission(l, copy, VYR_REQ_WRITE) != 0)
		failed = 7; /* ehole permits */
	else if (!failed && vyrrl_permission(l->rl, l->rl, VYR_REQ_READ) != 0)
		failed = 8;
	vyrl_put(copy);
	vyrl_put(l);
	return failed;
}
