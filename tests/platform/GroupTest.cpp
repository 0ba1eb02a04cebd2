#include "platform/run/Group.h"

#include <vector>

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Group, CallsBackOnceTheLastMemberHasLeft)
{
    int called = 0;
    const auto count = [&called] { ++called; };
    Group().notify(count);
    EXPECT_EQ(called, 1) << "nobody is inside";

    std::vector<Group::Member> members;
    {
        Group group;
        for (int i = 0; i < 3; ++i) members.push_back(group.enter());
        group.notify(count);
        group.notify(count);
    }
    members[0].leave();
    members[0].leave();
    members.pop_back();
    EXPECT_EQ(called, 1) << "one is left, though the group is gone";
    members[1] = std::move(members[0]); // drops what it held
    EXPECT_EQ(called, 3);
    members.clear();
    EXPECT_EQ(called, 3) << "once each";
}

} // namespace
} // namespace platform
