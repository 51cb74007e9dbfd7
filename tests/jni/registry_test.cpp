// The module registry, driven through a real Java VM with -Xcheck:jni: any
// JNI misuse (a deleted reference used, a call with an exception pending, an
// unbalanced monitor) aborts or fails the case.
#include "registry.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "jvm_fixture.h"
#include "log_capture.h"

namespace {

using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using voktest::LogCapture;
using voktest::Module;

const std::string kTag = "[native jni pkcs11wrapper]";
const std::string kNoEnv =
    "6:callback_handler: failed to get JNI environment, assuming native thread|";
const std::string kNoAttach = "6:callback_handler: failed to attach current thread|";
const std::string kMissing =
    "3:the entry is not in the list|3:failed getting module entry|3:failed getting module entry|";

// Only their addresses matter.
CK_FUNCTION_LIST gListA{}, gListB{}, gListC{}, gListD{};

// The registry's lines, each as "<priority>:<text>|".
std::string logged(const LogCapture& log) {
    std::string all;
    for (const auto& line : log.lines())
        if (line.tag == kTag) all += std::to_string(line.priority) + ":" + line.text + "|";
    return all;
}

std::vector<ModuleEntry*> listedEntries() {
    std::vector<ModuleEntry*> entries;
    for (ModuleListNode* node = moduleListHead; node != nullptr && entries.size() < 1000;
         node = node->next)
        entries.push_back(node->entry);
    return entries;
}

jint envState() {
    void* env = nullptr;
    return voktest::javaVM()->GetEnv(&env, JNI_VERSION_1_2);
}

void freeEntry(ModuleEntry* entry) {
    std::free(entry->moduleName);
    std::free(entry);
}

class Registry : public voktest::JvmTest {
protected:
    Module add(const char* name, CK_FUNCTION_LIST_PTR list) {
        return voktest::registerModule(name, list);
    }
    void finalize() { Java_com_vok_smartcard_pkcs11_Pkcs11_finalizeLibrary(env_, nullptr); }
};

TEST_F(Registry, OnLoadStoresTheVmAndAnswersJni12) {
    LogCapture log;
    gJavaVM = nullptr;
    EXPECT_EQ(JNI_OnLoad(voktest::javaVM(), nullptr), 0x10002);
    EXPECT_EQ(gJavaVM, voktest::javaVM());
    EXPECT_EQ(logged(log), "3:jni_onload : QUORVEL PKCS11Wrapper version : 2.4|");
}

TEST_F(Registry, EqualsIsIdentityWhateverTheClassSays) {
    jobject object = voktest::newKey();
    jobject other = voktest::newKey();
    jstring text = env_->NewStringUTF("same text");
    jstring equalText = env_->NewStringUTF("same text");
    struct {
        const char* what;
        jobject first, second;
        int expected;
    } cases[] = {
        {"both null", nullptr, nullptr, 1},
        {"first null", nullptr, object, 0},
        {"second null", object, nullptr, 0},
        {"two references to one object", object, env_->NewGlobalRef(object), 1},
        {"distinct objects", object, other, 0},
        // String.equals would call them equal.
        {"equal strings, distinct objects", text, equalText, 0},
    };
    for (const auto& c : cases) EXPECT_EQ(equals(env_, c.first, c.second), c.expected) << c.what;
}

TEST_F(Registry, SameObjectUnderTwoReferencesReplacesTheEntry) {
    jobject object = voktest::newKey();
    ModuleEntry* older = voktest::registerModule(env_->NewGlobalRef(object), "older", &gListA);
    ModuleEntry* newer = voktest::registerModule(env_->NewGlobalRef(object), "newer", &gListB);

    EXPECT_THAT(listedEntries(), ElementsAre(newer));
    EXPECT_EQ(getModuleEntry(env_, object), newer);
    EXPECT_EQ(getFunctionsByModule("newer"), &gListB);
    EXPECT_EQ(getModuleEntryByName("older"), nullptr);
    // The node still holds a live reference to the object.
    EXPECT_EQ(equals(env_, moduleListHead->key, object), 1);
    freeEntry(older);  // handed back to its owner by the replace
}

// By object, and by name: a name matches whole and never an entry without
// one; no name means the first module.
TEST_F(Registry, LookupsByObjectAndByNameAndWhatTheyLog) {
    {
        LogCapture log;
        EXPECT_EQ(getFunctionsByModule(nullptr), nullptr) << "empty registry";
        EXPECT_EQ(logged(log),
                  "3: getFunctionsByModule|3:module name passed NULL|3:failed getting module "
                  "entry|3:failed getting module entry|");
    }
    Module alpha = add("alpha", &gListA);
    Module unnamed = add(nullptr, &gListB);
    Module nolist = add("nolist", nullptr);
    Module tail = add("tail", &gListC);
    struct {
        const char* what;
        jobject object;
        ModuleEntry* expected;
        std::string lines;
    } byObject[] = {
        {"head", alpha.object, alpha.entry, "3:found the entry|3:module name alpha|"},
        {"unnamed", unnamed.object, unnamed.entry, "3:found the entry|3:module name (null)|"},
        {"tail", tail.object, tail.entry, "3:found the entry|3:module name tail|"},
        {"stranger", voktest::newKey(), nullptr, "3:the entry is not in the list|"},
        {"null object", nullptr, nullptr, ""},
    };
    for (const auto& c : byObject) {
        LogCapture log;
        EXPECT_EQ(getModuleEntry(env_, c.object), c.expected) << c.what;
        EXPECT_EQ(isModulePresent(env_, c.object), c.expected != nullptr ? 1 : 0) << c.what;
        EXPECT_EQ(logged(log), c.lines + c.lines) << c.what;  // isModulePresent logs again
        if (c.expected == nullptr) {
            EXPECT_EQ(removeModuleEntry(env_, c.object), nullptr) << c.what;
        }
    }
    EXPECT_THAT(listedEntries(), ElementsAre(alpha.entry, unnamed.entry, nolist.entry, tail.entry));

    struct {
        const char* name;
        CK_FUNCTION_LIST_PTR expected;
        std::string lines;  // after the call's and the name's lines
    } byName[] = {
        {"alpha", &gListA, "3:found the entry|"},
        {"tail", &gListC, "3:found the entry|"},
        {nullptr, &gListA, "3:found default entry|"},
        {"nolist", nullptr, "3:found the entry|3:ckpFunctions is null getFunctionsByModule|"},
        {"missing", nullptr, kMissing},
        {"", nullptr, kMissing},
        {"alph", nullptr, kMissing},
    };
    for (const auto& c : byName) {
        const std::string shown = c.name != nullptr ? c.name : "NULL";
        LogCapture log;
        EXPECT_EQ(getFunctionsByModule(c.name), c.expected) << shown;
        EXPECT_EQ(logged(log), "3: getFunctionsByModule|3:module name passed " + shown + "|" + c.lines)
            << shown;
    }
    // The default is the first module still connected.
    freeEntry(removeModuleEntry(env_, alpha.object));
    EXPECT_EQ(getFunctionsByModule(nullptr), &gListB);
}

TEST_F(Registry, RemoveUnlinksHeadMiddleAndTail) {
    for (size_t removed = 0; removed < 3; ++removed) {
        SCOPED_TRACE("removing node " + std::to_string(removed));
        Module modules[] = {add("a", &gListA), add("b", &gListB), add("c", &gListC)};
        std::vector<ModuleEntry*> remaining;
        for (size_t i = 0; i < 3; ++i)
            if (i != removed) remaining.push_back(modules[i].entry);

        ModuleEntry* entry = removeModuleEntry(env_, modules[removed].object);
        ASSERT_EQ(entry, modules[removed].entry);
        EXPECT_EQ(entry->functionList, modules[removed].entry->functionList);
        EXPECT_THAT(listedEntries(), ElementsAreArray(remaining));
        EXPECT_EQ(removeModuleEntry(env_, modules[removed].object), nullptr);
        EXPECT_EQ(getModuleEntry(env_, modules[removed].object), nullptr);
        EXPECT_EQ(getModuleEntryByName(std::string(1, char('a' + removed)).c_str()), nullptr);

        // The list stays well formed: a new module goes after the last one left.
        Module added = add("d", &gListD);
        remaining.push_back(added.entry);
        EXPECT_THAT(listedEntries(), ElementsAreArray(remaining));
        freeEntry(entry);
        removeAllModuleEntries(env_);  // abandons the entries it unlinks
        for (ModuleEntry* left : remaining) freeEntry(left);
    }
}

// Remove-all keeps the lock; finalize deletes it, and without it every
// registry function does nothing until the library is initialised again.
TEST_F(Registry, RemoveAllKeepsTheLockAndFinalizeDeletesIt) {
    Module a = add("a", &gListA);
    Module b = add("b", &gListB);
    const jobject lock = moduleListLock;
    removeAllModuleEntries(env_);
    EXPECT_EQ(moduleListHead, nullptr);
    EXPECT_EQ(moduleListLock, lock);
    EXPECT_EQ(a.entry->functionList, &gListA);  // abandoned, not freed
    EXPECT_EQ(b.entry->functionList, &gListB);
    Module c = add("c", &gListC);
    EXPECT_THAT(listedEntries(), ElementsAre(c.entry));

    finalize();
    EXPECT_EQ(moduleListHead, nullptr);
    EXPECT_EQ(moduleListLock, nullptr);
    finalize();  // a second one finds nothing to do
    EXPECT_EQ(moduleListLock, nullptr);
    EXPECT_EQ(getModuleEntry(env_, c.object), nullptr);
    EXPECT_EQ(isModulePresent(env_, c.object), 0);
    EXPECT_EQ(getFunctionsByModule(nullptr), nullptr);
    EXPECT_EQ(removeModuleEntry(env_, c.object), nullptr);
    jobject key = voktest::newKey();
    ModuleEntry entry{};
    putModuleEntry(env_, key, &entry);
    EXPECT_EQ(moduleListHead, nullptr);
    removeAllModuleEntries(env_);
    env_->DeleteGlobalRef(key);  // not taken over
    for (ModuleEntry* abandoned : {a.entry, b.entry, c.entry}) freeEntry(abandoned);

    // A native thread's lookup then finds nothing and leaves the thread attached.
    LogCapture log;
    ModuleEntry* found = &entry;
    jint after = JNI_EDETACHED;
    std::thread([&] {
        found = getModuleEntryByName("c");
        after = envState();
        if (after == JNI_OK) voktest::javaVM()->DetachCurrentThread();
    }).join();
    EXPECT_EQ(found, nullptr);
    EXPECT_EQ(after, JNI_OK);
    EXPECT_EQ(logged(log), "3:module name passed c|" + kNoEnv);

    // A second initialisation keeps the lock.
    voktest::initializeLibrary();
    const jobject again = moduleListLock;
    ASSERT_NE(again, nullptr);
    voktest::initializeLibrary();
    EXPECT_EQ(moduleListLock, again);
    Module d = add("d", &gListD);
    EXPECT_EQ(getModuleEntry(env_, d.object), d.entry);
}

void* failingAlloc(std::size_t) { return nullptr; }

jboolean holdsLock(JNIEnv* env, jobject object) {
    jclass thread = env->FindClass("java/lang/Thread");
    jmethodID holds = env->GetStaticMethodID(thread, "holdsLock", "(Ljava/lang/Object;)Z");
    jboolean held = env->CallStaticBooleanMethod(thread, holds, object);
    EXPECT_FALSE(env->ExceptionCheck());
    env->DeleteLocalRef(thread);
    return held;
}

TEST_F(Registry, NodeAllocationFailureThrowsAndReleasesTheMonitor) {
    for (bool emptyList : {true, false}) {
        SCOPED_TRACE(emptyList ? "first node" : "appended node");
        removeAllModuleEntries(env_);
        std::vector<ModuleEntry*> before;
        if (!emptyList) before.push_back(add("present", &gListA).entry);

        jobject key = voktest::newKey();
        ModuleEntry entry{};
        gModuleListNodeAlloc = failingAlloc;
        putModuleEntry(env_, key, &entry);
        gModuleListNodeAlloc = std::malloc;

        voktest::ThrownException thrown = voktest::takePendingException(env_);
        EXPECT_TRUE(thrown.thrown);
        EXPECT_EQ(thrown.className, "java.lang.OutOfMemoryError");
        EXPECT_THAT(listedEntries(), ElementsAreArray(before));
        EXPECT_FALSE(holdsLock(env_, moduleListLock));
        env_->DeleteGlobalRef(key);
    }
}

bool currentThreadIsDaemon(JNIEnv* env) {
    jclass thread = env->FindClass("java/lang/Thread");
    jmethodID current = env->GetStaticMethodID(thread, "currentThread", "()Ljava/lang/Thread;");
    jobject self = env->CallStaticObjectMethod(thread, current);
    if (env->ExceptionCheck()) return false;
    const jboolean daemon = env->CallBooleanMethod(self, env->GetMethodID(thread, "isDaemon", "()Z"));
    return !env->ExceptionCheck() && daemon == JNI_TRUE;
}

// A thread with no JNI environment is attached for the lookup only, with an
// error line; one that has an environment keeps it. The server thread's way:
// attached once, as a daemon, it stays attached and looks up without error
// lines.
TEST_F(Registry, NameLookupsFromEveryKindOfThread) {
    add("alpha", &gListA);
    enum How { Native, Attached, KeptAttached };
    const std::string call = "3: getFunctionsByModule|3:module name passed alpha|";
    struct {
        const char* what;
        How how;
        std::string lines;
    } cases[] = {
        {"native thread", Native, call + kNoEnv + "3:found the entry|"},
        {"attached thread", Attached, call + "3:found the entry|"},
        {"kept attached", KeptAttached, call + "3:found the entry|"},
    };
    for (const auto& c : cases) {
        LogCapture log;
        CK_FUNCTION_LIST_PTR found = nullptr;
        jint before = JNI_OK, after = JNI_OK;
        int kept = 0;
        bool daemon = false;
        std::thread([&] {
            std::unique_ptr<voktest::AttachedThread> attached;
            if (c.how == Attached) attached = std::make_unique<voktest::AttachedThread>();
            if (c.how == KeptAttached) kept = keepThreadAttachedToJavaVm() + keepThreadAttachedToJavaVm();
            before = envState();
            found = getFunctionsByModule("alpha");
            after = envState();
            if (c.how != KeptAttached || after != JNI_OK) return;
            daemon = currentThreadIsDaemon(voktest::currentEnv());
            voktest::javaVM()->DetachCurrentThread();
        }).join();
        EXPECT_EQ(found, &gListA) << c.what;
        EXPECT_EQ(before, c.how == Native ? JNI_EDETACHED : JNI_OK) << c.what;
        EXPECT_EQ(after, before) << c.what;
        EXPECT_EQ(kept, c.how == KeptAttached ? 2 : 0) << c.what;
        EXPECT_EQ(daemon, c.how == KeptAttached) << c.what;
        EXPECT_EQ(logged(log), c.lines) << c.what;
    }

    // Without a VM nothing is attached and nothing found.
    JavaVM* vm = gJavaVM;
    gJavaVM = nullptr;
    LogCapture log;
    ModuleEntry* found = getModuleEntryByName("alpha");
    const int attached = keepThreadAttachedToJavaVm();
    gJavaVM = vm;
    EXPECT_EQ(found, nullptr);
    EXPECT_EQ(attached, 0);
    EXPECT_EQ(logged(log), "3:module name passed alpha|" + kNoEnv + kNoAttach);
}

// Java threads connecting and disconnecting while native threads look
// modules up by name: the monitor keeps the list whole, and every native
// lookup leaves its thread detached.
TEST_F(Registry, ListStaysWholeUnderMixedThreads) {
    constexpr int kJavaThreads = 3, kRounds = 200, kKeepEvery = 10;
    LogCapture log;  // keeps thousands of lines off the console
    Module anchor = add("anchor", &gListA);
    std::vector<std::vector<ModuleEntry*>> kept(kJavaThreads);
    std::atomic<int> stillAttached{0};
    std::vector<std::thread> threads;
    for (int id = 0; id < kJavaThreads; ++id)
        threads.emplace_back([&kept, id] {
            voktest::AttachedThread thread;
            JNIEnv* env = thread.env();
            ASSERT_NE(env, nullptr);
            for (int round = 0; round < kRounds; ++round) {
                const std::string name = std::to_string(id) + "-" + std::to_string(round);
                Module module = voktest::registerModule(name.c_str(), &gListB);
                EXPECT_EQ(getModuleEntry(env, module.object), module.entry) << name;
                EXPECT_EQ(getModuleEntryByName(name.c_str()), module.entry) << name;
                if (round % kKeepEvery == 0) {
                    kept[id].push_back(module.entry);
                } else {
                    EXPECT_EQ(removeModuleEntry(env, module.object), module.entry) << name;
                    std::free(module.entry);
                    EXPECT_EQ(getModuleEntryByName(name.c_str()), nullptr) << name;
                }
                env->DeleteGlobalRef(module.object);
            }
        });
    for (int id = 0; id < 2; ++id)
        threads.emplace_back([&stillAttached] {
            for (int round = 0; round < kRounds; ++round) {
                EXPECT_EQ(getFunctionsByModule("anchor"), &gListA);
                EXPECT_EQ(getModuleEntryByName("absent"), nullptr);
                if (envState() != JNI_EDETACHED) ++stillAttached;
            }
        });
    for (auto& t : threads) t.join();

    EXPECT_EQ(stillAttached.load(), 0);
    EXPECT_FALSE(log.contains(kTag, "callback_handler: failed to attach current thread"));
    // The anchor first; each worker's survivors once each, in that worker's order.
    const std::vector<ModuleEntry*> listed = listedEntries();
    ASSERT_EQ(listed.size(), 1u + kJavaThreads * (kRounds / kKeepEvery));
    EXPECT_EQ(listed.front(), anchor.entry);
    for (const auto& survivors : kept) {
        auto from = listed.begin();
        for (ModuleEntry* entry : survivors) {
            from = std::find(from, listed.end(), entry);
            ASSERT_NE(from, listed.end());
            EXPECT_EQ(std::count(listed.begin(), listed.end(), entry), 1);
        }
    }
}

}  // namespace
