/* A user's program: built against an installed prefix with pkg-config. */
#include <stdio.h>
#include <vyr.h>

int main(void)
{
	printf("vyrl_t is %zu bytes\n", sizeof(vyrl_t));
	return sizeof(vyrl_t) == 24 ? 0 : 1;
}
