// The entry point of every test program: tests run with the order of queues enforced.

#include <gmock/gmock.h>

#include "platform/run/QueueOrder.h"

int main(int argc, char** argv)
{
    testing::InitGoogleMock(&argc, argv);
    platform::QueueOrder::enforce();
    return RUN_ALL_TESTS();
}
