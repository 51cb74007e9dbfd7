// Java threads connecting and disconnecting while native threads (the shape of
// the server thread) look modules up by name: the monitor must keep the list
// whole, and every native lookup must leave its thread detached.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "jvm_fixture.h"
#include "log_capture.h"
#include "registry.h"

namespace {

CK_FUNCTION_LIST gAnchorList{}, gWorkerList{};

constexpr int kJavaThreads = 3;
constexpr int kNativeThreads = 2;
constexpr int kRounds = 200;
constexpr int kKeepEvery = 10;  // every tenth module stays connected

class RegistryConcurrency : public voktest::JvmTest {};

// One Java thread: connect, find by object and by name, disconnect; keeps
// every kKeepEvery-th module and returns those in connection order.
std::vector<ModuleEntry*> javaWorker(int id) {
    voktest::AttachedThread thread;
    JNIEnv* env = thread.env();
    std::vector<ModuleEntry*> kept;
    if (env == nullptr) {
        ADD_FAILURE() << "could not attach worker " << id;
        return kept;
    }
    for (int round = 0; round < kRounds; ++round) {
        const std::string name = "worker" + std::to_string(id) + "-" + std::to_string(round);
        voktest::Module module = voktest::registerModule(name.c_str(), &gWorkerList);
        EXPECT_EQ(getModuleEntry(env, module.object), module.entry) << name;
        EXPECT_EQ(getModuleEntryByName(name.c_str()), module.entry) << name;
        if (round % kKeepEvery == 0) {
            kept.push_back(module.entry);
        } else {
            ModuleEntry* removed = removeModuleEntry(env, module.object);
            EXPECT_EQ(removed, module.entry) << name;
            std::free(removed);
            EXPECT_EQ(getModuleEntryByName(name.c_str()), nullptr) << name;
        }
        env->DeleteGlobalRef(module.object);
    }
    return kept;
}

void nativeWorker(std::atomic<int>& stillAttached) {
    for (int round = 0; round < kRounds; ++round) {
        EXPECT_EQ(getFunctionsByModule("anchor"), &gAnchorList);
        EXPECT_EQ(getModuleEntryByName("absent"), nullptr);
        void* env = nullptr;
        if (voktest::javaVM()->GetEnv(&env, JNI_VERSION_1_2) != JNI_EDETACHED) ++stillAttached;
    }
}

TEST_F(RegistryConcurrency, ListStaysWholeUnderMixedThreads) {
    voktest::LogCapture log;  // keeps thousands of lines off the console
    voktest::Module anchor = voktest::registerModule("anchor", &gAnchorList);

    std::vector<std::vector<ModuleEntry*>> kept(kJavaThreads);
    std::atomic<int> stillAttached{0};
    std::vector<std::thread> threads;
    for (int id = 0; id < kJavaThreads; ++id)
        threads.emplace_back([&kept, id] { kept[id] = javaWorker(id); });
    for (int id = 0; id < kNativeThreads; ++id)
        threads.emplace_back([&stillAttached] { nativeWorker(stillAttached); });
    for (auto& t : threads) t.join();

    EXPECT_EQ(stillAttached.load(), 0);
    EXPECT_FALSE(log.contains("[native jni pkcs11wrapper]",
                              "callback_handler: failed to attach current thread"));

    std::vector<ModuleEntry*> listed;
    const size_t expected = 1 + kJavaThreads * (kRounds / kKeepEvery);
    for (ModuleListNode* node = moduleListHead; node != nullptr && listed.size() <= expected;
         node = node->next)
        listed.push_back(node->entry);
    ASSERT_EQ(listed.size(), expected);
    EXPECT_EQ(listed.front(), anchor.entry);
    // Each worker's survivors appear once each, in that worker's order.
    for (const auto& survivors : kept) {
        ASSERT_EQ(survivors.size(), static_cast<size_t>(kRounds / kKeepEvery));
        auto from = listed.begin();
        for (ModuleEntry* entry : survivors) {
            from = std::find(from, listed.end(), entry);
            ASSERT_NE(from, listed.end());
            EXPECT_EQ(std::count(listed.begin(), listed.end(), entry), 1);
        }
    }
}

}  // namespace
