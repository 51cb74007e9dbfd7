#ifndef VOK_JNI_REGISTRY_H
#define VOK_JNI_REGISTRY_H

#include <jni.h>

#include <cstddef>

#include "vok_export.h"
#include "vok_registry.h"

// The registry: one node per Java Pkcs11 object that connected a module, in
// the order they connected. Every list operation holds the Java monitor of
// moduleListLock; a null lock means the library is not initialised and every
// registry function does nothing.
typedef struct ModuleListNode {
    jobject key;  // global reference to the owning Java object
    ModuleEntry* entry;
    struct ModuleListNode* next;
} ModuleListNode;

VOK_C_API JavaVM* gJavaVM;
VOK_C_API jobject moduleListLock;
VOK_C_API ModuleListNode* moduleListHead;

VOK_C_API jint JNICALL JNI_OnLoad(JavaVM* vm, void* reserved);
VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_initializeLibrary(JNIEnv* env,
                                                                              jobject thiz);
VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_finalizeLibrary(JNIEnv* env,
                                                                            jobject thiz);

// Lookups by Java object compare by identity (java.lang.Object.equals called
// non-virtually), whatever the object's class overrides.
ModuleEntry* getModuleEntry(JNIEnv* env, jobject obj);
// getModuleEntry with a hold on the entry (see ModuleHold), to be given back
// with releaseModuleEntry; null also when the hold could not be recorded.
ModuleEntry* holdModuleEntryOf(JNIEnv* env, jobject obj);
int isModulePresent(JNIEnv* env, jobject obj);
// Takes ownership of key (a global reference) and of entry->moduleName,
// unless it returns with a Java exception pending. When key's object is
// already registered, that node gets the new entry and key is deleted; the
// previous entry is left to its owner.
void putModuleEntry(JNIEnv* env, jobject key, ModuleEntry* entry);
// Unlinks obj's node and hands its entry back (moduleName freed and cleared).
ModuleEntry* removeModuleEntry(JNIEnv* env, jobject obj);
// Frees every node and name; the entries themselves are abandoned.
void removeAllModuleEntries(JNIEnv* env);
int equals(JNIEnv* env, jobject first, jobject second);
jobject createLockObject(JNIEnv* env);
void destroyLockObject(JNIEnv* env, jobject lock);

// Allocator of list nodes (malloc); tests swap it to reach the failure path.
extern void* (*gModuleListNodeAlloc)(std::size_t size);

#endif
