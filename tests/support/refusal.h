// A call that fails.
#ifndef IMG_TEST_REFUSAL_H
#define IMG_TEST_REFUSAL_H

#include "support/files.h"

#include <gtest/gtest.h>

// Returns what `call`, which is to answer -1, prints.
template <typename Call, typename... Arguments>
std::string refusal(Call call, Arguments... arguments)
{
    return printed_by([&] { EXPECT_EQ(call(arguments...), -1); });
}

#endif
