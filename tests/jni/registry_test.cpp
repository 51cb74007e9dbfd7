// The module registry, driven through a real Java VM with -Xcheck:jni: any
// JNI misuse (a deleted reference used, a call with an exception pending, an
// unbalanced monitor) aborts or fails the case.
#include "registry.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

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
using voktest::LogLine;
using voktest::Module;

const std::string kTag = "[native jni pkcs11wrapper]";
constexpr int kDebug = 3;
constexpr int kError = 6;
const char* const kNoEnvLine =
    "callback_handler: failed to get JNI environment, assuming native thread";
const char* const kNoAttachLine = "callback_handler: failed to attach current thread";

// Only their addresses matter.
CK_FUNCTION_LIST gListA{}, gListB{}, gListC{}, gListD{};

LogLine debug(const std::string& text) { return {kTag, kDebug, text}; }
LogLine error(const std::string& text) { return {kTag, kError, text}; }

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
    EXPECT_THAT(log.lines(),
                ElementsAre(debug("jni_onload : QUORVEL PKCS11Wrapper version : 2.4")));
}

TEST_F(Registry, EqualsIsIdentityWhateverTheClassSays) {
    jobject object = voktest::newKey();
    jobject sameObject = env_->NewGlobalRef(object);
    jobject other = voktest::newKey();
    jstring text = env_->NewStringUTF("same text");
    jstring equalText = env_->NewStringUTF("same text");
    jclass stringClass = env_->FindClass("java/lang/String");
    jmethodID stringEquals = env_->GetMethodID(stringClass, "equals", "(Ljava/lang/Object;)Z");
    ASSERT_TRUE(env_->CallBooleanMethod(text, stringEquals, equalText))
        << "String.equals should hold";
    ASSERT_FALSE(env_->ExceptionCheck());

    struct {
        const char* what;
        jobject first;
        jobject second;
        int expected;
    } cases[] = {
        {"both null", nullptr, nullptr, 1},
        {"first null", nullptr, object, 0},
        {"second null", object, nullptr, 0},
        {"two references to one object", object, sameObject, 1},
        {"distinct objects", object, other, 0},
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

TEST_F(Registry, LookupByObjectLogsWhatItFound) {
    Module alpha = add("alpha", &gListA);
    Module unnamed = add(nullptr, &gListB);
    Module tail = add("tail", &gListC);
    jobject stranger = voktest::newKey();

    struct {
        const char* what;
        jobject object;
        ModuleEntry* expected;
        std::vector<LogLine> lines;
    } cases[] = {
        {"head", alpha.object, alpha.entry, {debug("found the entry"), debug("module name alpha")}},
        {"unnamed",
         unnamed.object,
         unnamed.entry,
         {debug("found the entry"), debug("module name (null)")}},
        {"tail", tail.object, tail.entry, {debug("found the entry"), debug("module name tail")}},
        {"stranger", stranger, nullptr, {debug("the entry is not in the list")}},
        {"null object", nullptr, nullptr, {}},
    };
    for (const auto& c : cases) {
        LogCapture log;
        EXPECT_EQ(getModuleEntry(env_, c.object), c.expected) << c.what;
        EXPECT_EQ(isModulePresent(env_, c.object), c.expected != nullptr ? 1 : 0) << c.what;
        std::vector<LogLine> twice = c.lines;  // isModulePresent logs the same again
        twice.insert(twice.end(), c.lines.begin(), c.lines.end());
        EXPECT_EQ(log.lines(), twice) << c.what;
    }
}

// A name matches whole and never an entry without one; no name means the
// first module.
TEST_F(Registry, FunctionsByModuleName) {
    {
        LogCapture log;
        EXPECT_EQ(getFunctionsByModule(nullptr), nullptr) << "empty registry";
        EXPECT_THAT(log.lines(), ElementsAre(debug(" getFunctionsByModule"),
                                             debug("module name passed NULL"),
                                             debug("failed getting module entry"),
                                             debug("failed getting module entry")));
    }
    add("alpha", &gListA);
    add("gamma", &gListC);
    add("nolist", nullptr);
    add(nullptr, &gListB);  // an unnamed tail

    const std::vector<std::string> missing = {"the entry is not in the list",
                                              "failed getting module entry",
                                              "failed getting module entry"};
    struct {
        const char* name;
        CK_FUNCTION_LIST_PTR expected;
        std::vector<std::string> lines;  // after the call's and the name's lines
    } cases[] = {
        {"alpha", &gListA, {"found the entry"}},
        {"gamma", &gListC, {"found the entry"}},
        {nullptr, &gListA, {"found default entry"}},
        {"nolist", nullptr, {"found the entry", "ckpFunctions is null getFunctionsByModule"}},
        {"missing", nullptr, missing},
        {"", nullptr, missing},
        {"alph", nullptr, missing},
    };
    for (const auto& c : cases) {
        const std::string shown = c.name != nullptr ? c.name : "NULL";
        std::vector<LogLine> expected = {debug(" getFunctionsByModule"),
                                         debug("module name passed " + shown)};
        for (const auto& line : c.lines) expected.push_back(debug(line));
        LogCapture log;
        EXPECT_EQ(getFunctionsByModule(c.name), c.expected) << shown;
        EXPECT_EQ(log.lines(), expected) << shown;
    }
}

TEST_F(Registry, DefaultModuleIsTheFirstConnectedStill) {
    Module first = add("first", &gListA);
    add("second", &gListB);
    EXPECT_EQ(getFunctionsByModule(nullptr), &gListA);
    freeEntry(removeModuleEntry(env_, first.object));
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

TEST_F(Registry, RemovingAnUnknownObjectChangesNothing) {
    Module a = add("a", &gListA);
    Module b = add("b", &gListB);
    jobject stranger = voktest::newKey();
    EXPECT_EQ(removeModuleEntry(env_, stranger), nullptr);
    EXPECT_EQ(removeModuleEntry(env_, nullptr), nullptr);
    EXPECT_THAT(listedEntries(), ElementsAre(a.entry, b.entry));
}

TEST_F(Registry, RemoveAllKeepsTheLockAndTheEntries) {
    Module a = add("a", &gListA);
    Module b = add("b", &gListB);
    jobject lock = moduleListLock;
    removeAllModuleEntries(env_);
    EXPECT_EQ(moduleListHead, nullptr);
    EXPECT_EQ(moduleListLock, lock);
    EXPECT_EQ(a.entry->functionList, &gListA);  // abandoned, not freed
    EXPECT_EQ(b.entry->functionList, &gListB);

    Module c = add("c", &gListC);
    EXPECT_THAT(listedEntries(), ElementsAre(c.entry));
    freeEntry(a.entry);
    freeEntry(b.entry);
}

// Without the lock every registry function does nothing.
TEST_F(Registry, FinalizeAfterEveryNodeWasRemovedDeletesTheLock) {
    Module a = add("a", &gListA);
    Module b = add("b", &gListB);
    freeEntry(removeModuleEntry(env_, a.object));
    freeEntry(removeModuleEntry(env_, b.object));
    finalize();
    EXPECT_EQ(moduleListLock, nullptr);

    EXPECT_EQ(getModuleEntry(env_, a.object), nullptr);
    EXPECT_EQ(isModulePresent(env_, b.object), 0);
    EXPECT_EQ(getModuleEntryByName("a"), nullptr);
    EXPECT_EQ(getFunctionsByModule(nullptr), nullptr);
    EXPECT_EQ(removeModuleEntry(env_, a.object), nullptr);
    jobject key = voktest::newKey();
    ModuleEntry entry{};
    putModuleEntry(env_, key, &entry);
    EXPECT_EQ(moduleListHead, nullptr);
    removeAllModuleEntries(env_);
    env_->DeleteGlobalRef(key);  // not taken over

    // Until the library is initialised again; a second initialisation keeps the lock.
    voktest::initializeLibrary();
    const jobject lock = moduleListLock;
    ASSERT_NE(lock, nullptr);
    voktest::initializeLibrary();
    EXPECT_EQ(moduleListLock, lock);
    Module c = add("c", &gListC);
    EXPECT_EQ(getModuleEntry(env_, c.object), c.entry);
}

TEST_F(Registry, FinalizeEmptiesAFilledRegistryToo) {
    Module a = add("a", &gListA);
    finalize();
    EXPECT_EQ(moduleListHead, nullptr);
    EXPECT_EQ(moduleListLock, nullptr);
    EXPECT_EQ(getModuleEntry(env_, a.object), nullptr);
    finalize();  // a second one finds nothing to do
    EXPECT_EQ(moduleListLock, nullptr);
    freeEntry(a.entry);  // abandoned by finalize
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

// A name lookup from a thread with no JNI environment attaches it for the
// lookup only; a thread that has one keeps it.
TEST_F(Registry, NameLookupFromThreadsWithAndWithoutJni) {
    Module alpha = add("alpha", &gListA);
    struct {
        const char* what;
        bool javaThread;
        std::vector<LogLine> lines;
    } cases[] = {
        {"native thread",
         false,
         {debug(" getFunctionsByModule"), debug("module name passed alpha"), error(kNoEnvLine),
          debug("found the entry")}},
        {"attached thread",
         true,
         {debug(" getFunctionsByModule"), debug("module name passed alpha"),
          debug("found the entry")}},
    };
    for (const auto& c : cases) {
        LogCapture log;
        CK_FUNCTION_LIST_PTR found = nullptr;
        jint before = JNI_OK, after = JNI_OK;
        std::thread([&] {
            std::unique_ptr<voktest::AttachedThread> attached;
            if (c.javaThread) attached = std::make_unique<voktest::AttachedThread>();
            before = envState();
            found = getFunctionsByModule("alpha");
            after = envState();
        }).join();
        EXPECT_EQ(found, &gListA) << c.what;
        EXPECT_EQ(before, c.javaThread ? JNI_OK : JNI_EDETACHED) << c.what;
        EXPECT_EQ(after, before) << c.what;
        EXPECT_EQ(log.lines(), c.lines) << c.what;
    }
    EXPECT_EQ(getModuleEntry(env_, alpha.object), alpha.entry);
}

TEST_F(Registry, NativeThreadStaysAttachedWhenTheLibraryIsNotInitialised) {
    Module alpha = add("alpha", &gListA);
    finalize();
    freeEntry(alpha.entry);  // abandoned by finalize
    LogCapture log;
    ModuleEntry sentinel{};
    ModuleEntry* found = &sentinel;
    jint after = JNI_EDETACHED;
    std::thread([&] {
        found = getModuleEntryByName("alpha");
        after = envState();
        if (after == JNI_OK) voktest::javaVM()->DetachCurrentThread();
    }).join();
    EXPECT_EQ(found, nullptr);
    EXPECT_EQ(after, JNI_OK);
    EXPECT_TRUE(log.contains(kTag, kNoEnvLine));
    EXPECT_FALSE(log.contains(kTag, kNoAttachLine));
}

bool currentThreadIsDaemon(JNIEnv* env) {
    jclass thread = env->FindClass("java/lang/Thread");
    jmethodID current = env->GetStaticMethodID(thread, "currentThread", "()Ljava/lang/Thread;");
    jobject self = env->CallStaticObjectMethod(thread, current);
    if (env->ExceptionCheck()) return false;
    const jboolean daemon = env->CallBooleanMethod(self, env->GetMethodID(thread, "isDaemon", "()Z"));
    return !env->ExceptionCheck() && daemon == JNI_TRUE;
}

// The server thread's way: attached once, as a daemon, it stays attached
// through its lookups, which then find their environment without error lines.
TEST_F(Registry, AThreadKeptAttachedIsADaemonThatLooksUpWithoutErrorLines) {
    add("alpha", &gListA);
    LogCapture log;
    int first = -1, again = -1;
    bool daemon = false;
    CK_FUNCTION_LIST_PTR found = nullptr;
    jint after = JNI_EDETACHED;
    std::thread([&] {
        first = keepThreadAttachedToJavaVm();
        again = keepThreadAttachedToJavaVm();
        found = getFunctionsByModule("alpha");
        after = envState();
        if (after != JNI_OK) return;
        daemon = currentThreadIsDaemon(voktest::currentEnv());
        voktest::javaVM()->DetachCurrentThread();
    }).join();
    EXPECT_EQ(first, 1);
    EXPECT_EQ(again, 1);
    EXPECT_EQ(found, &gListA);
    EXPECT_EQ(after, JNI_OK);
    EXPECT_TRUE(daemon);
    EXPECT_FALSE(log.contains(kTag, kNoEnvLine));
}

TEST_F(Registry, NameLookupWithoutAVmGivesUp) {
    add("alpha", &gListA);
    JavaVM* vm = gJavaVM;
    gJavaVM = nullptr;
    LogCapture log;
    ModuleEntry* found = getModuleEntryByName("alpha");
    const int attached = keepThreadAttachedToJavaVm();
    gJavaVM = vm;
    EXPECT_EQ(found, nullptr);
    EXPECT_EQ(attached, 0);
    EXPECT_THAT(log.lines(), ElementsAre(debug("module name passed alpha"), error(kNoEnvLine),
                                         error(kNoAttachLine)));
}

}  // namespace
