// The umbrella header compiles as C++20 with the project's warnings.
#include <vyr.h>

static_assert(sizeof(vyrl_t) == 24);
int vyr_abi_layout_cxx() { return static_cast<int>(sizeof(vyrml_t)); }
