// Runs the C11 translation unit's checks of the label header.
#include <gtest/gtest.h>

extern "C" int label_c11_check(void);

TEST(LabelHeaderC11, CallsFromC)
{
	EXPECT_EQ(label_c11_check(), 0) << "number of the failed check in label_c11.c";
}
