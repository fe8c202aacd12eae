#include <gtest/gtest.h>
#include <poll.h>

#include <atomic>
#include <future>

#include "gate/Owners.h"

using gate::Owners;

namespace {

// Waits until a name that was asked for is known.
void awaitName(Owners& owners)
{
    struct pollfd event = {owners.descriptor(), POLLIN, 0};
    ASSERT_EQ(1, poll(&event, 1, 10000));
    owners.clear();
}

} // namespace

TEST(Owners, AreLookedUpOnceAndRemembered)
{
    std::atomic<int> nLookUps{0};
    // Never destroyed, as in the gate: its thread may be blocked in a look-up.
    auto& owners = *new Owners([&nLookUps](uid_t uid) {
        ++nLookUps;
        return uid ? Owners::Owner{Owners::State::Nobody, ""} : Owners::Owner{Owners::State::Known, "root"};
    });
    for (const uid_t uid : {0U, 1000U}) {
        EXPECT_EQ(Owners::State::Asked, owners.find(uid).state);
        awaitName(owners);
    }
    EXPECT_EQ(Owners::State::Known, owners.find(0).state);
    EXPECT_EQ("root", owners.find(0).strName);
    EXPECT_EQ(Owners::State::Nobody, owners.find(1000).state);
    EXPECT_EQ(2, nLookUps);
}

TEST(Owners, AnswerAtOnceWhileALookUpStalls)
{
    auto& release = *new std::promise<void>;
    auto& owners = *new Owners([&release](uid_t) {
        release.get_future().wait();
        return Owners::Owner{Owners::State::Failing, ""};
    });
    EXPECT_EQ(Owners::State::Asked, owners.find(0).state);
    EXPECT_EQ(Owners::State::Asked, owners.find(0).state);
    release.set_value();
    awaitName(owners);
    EXPECT_EQ(Owners::State::Failing, owners.find(0).state);
}

TEST(Owners, AreThoseOfTheUserDatabase)
{
    const Owners::Owner root = gate::lookUpOwner(0);
    EXPECT_EQ(Owners::State::Known, root.state);
    EXPECT_EQ("root", root.strName);
    EXPECT_EQ(Owners::State::Nobody, gate::lookUpOwner(4000000000U).state);
}
