#include <gtest/gtest.h>
#include <poll.h>

#include <atomic>
#include <future>

#include "gate/Owners.h"

using gate::Owners;

TEST(Owners, AreLookedUpOnceWhileNobodyWaits)
{
    static const Owners::Owner FOUND[] = {
        {Owners::State::Known, "root"}, {Owners::State::Nobody, ""}, {Owners::State::Failing, ""}};
    static std::promise<void> release[3];
    static std::atomic<int> nLookUps{0};
    // Never destroyed, as in the gate: its thread may be blocked in a look-up.
    auto& owners = *new Owners([](uid_t uid) {
        ++nLookUps;
        release[uid].get_future().wait();
        return FOUND[uid];
    });
    for (uid_t uid = 0; uid < 3; ++uid) {
        EXPECT_EQ(Owners::State::Asked, owners.find(uid).state);
        EXPECT_EQ(Owners::State::Asked, owners.find(uid).state);
        release[uid].set_value();
        struct pollfd event = {owners.descriptor(), POLLIN, 0};
        ASSERT_EQ(1, poll(&event, 1, 10000));
        owners.clear();
    }
    for (uid_t uid = 0; uid < 3; ++uid) {
        EXPECT_EQ(FOUND[uid].state, owners.find(uid).state);
        EXPECT_EQ(FOUND[uid].strName, owners.find(uid).strName);
    }
    EXPECT_EQ(3, nLookUps);
}

TEST(Owners, AreThoseOfTheUserDatabase)
{
    const Owners::Owner root = gate::lookUpOwner(0);
    EXPECT_EQ(Owners::State::Known, root.state);
    EXPECT_EQ("root", root.strName);
    EXPECT_EQ(Owners::State::Nobody, gate::lookUpOwner(4000000000U).state);
}
