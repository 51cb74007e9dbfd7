#ifndef VOK_TEST_SERVER_SUPPORT_H
#define VOK_TEST_SERVER_SUPPORT_H

// Shared by the server tests: requests built from a fill function, answers
// parsed back, and a fake module prepared with a user session and objects.

#include <gtest/gtest.h>

#include <functional>
#include <ostream>
#include <stdexcept>
#include <string>
#include <vector>

#include "fake_vendor.h"
#include "vok_proto.h"
#include "vok_server.h"

namespace servertest {

using Fill = std::function<void(pkcs11::Operation&)>;
using Handler = std::string (*)(const std::string&);

inline std::string requestBytes(const std::string& name, const Fill& fill = {}) {
    pkcs11::Operation op;
    op.set_name(name);
    if (fill) fill(op);
    return op.SerializeAsString();
}

inline pkcs11::OperationResult parsed(const std::string& answer) {
    pkcs11::OperationResult res;
    EXPECT_TRUE(res.ParseFromString(answer)) << "answer does not parse";
    return res;
}

// The answer of a call whose only outputs are `name` and `result`.
inline std::string bareAnswer(const std::string& name, CK_RV result) {
    pkcs11::OperationResult res;
    res.set_name(name);
    res.set_result(result);
    return res.SerializeAsString();
}

inline void setAttribute(pkcs11::CK_ATTRIBUTE* a, CK_ATTRIBUTE_TYPE type, const std::string& value,
                         CK_ULONG length) {
    a->set_type(type);
    a->set_pvalue(value);
    a->set_ulvaluelen(length);
}

inline std::string hex(const std::string& bytes) { return fakevendor::hex(bytes); }
inline std::string zeros(size_t bytes) { return std::string(2 * bytes, '0'); }

// The parameter lines of the module's record of its last call of `function`.
inline std::vector<std::string> received(const std::string& function) {
    const std::string text = fakevendor::lastCall(function).text;
    std::vector<std::string> lines;
    for (size_t start = text.find('\n') + 1, end; start != 0; start = end + 1) {
        end = text.find('\n', start);
        lines.push_back(text.substr(start, end - start));
        if (end == std::string::npos) break;
    }
    return lines;
}

// Reports whether the handler's answer sub-message is present and removes it.
using AnswerProbe = bool (*)(pkcs11::OperationResult&);
#define ANSWER(field)                         \
    [](pkcs11::OperationResult& r) {                           \
        const bool present = r.has_##field(); \
        r.clear_##field();                    \
        return present;                       \
    }

struct FrameRow {
    const char* command;
    Handler handler;
    const char* moduleFunction;
    AnswerProbe answer;                // nullptr: only name and result
    const char* answeredAs = nullptr;  // nullptr: the command
};

inline void PrintTo(const FrameRow& row, std::ostream* os) { *os << row.command; }

// Every handler: its command, the module function it calls, its answer
// sub-message, and the name it answers under where that is not the command.
// FRAME: the module function has the command's name.
#define FRAME(command, answer) {#command, command##_Server, #command, answer}
// clang-format off
inline const FrameRow kFrameRows[] = {
    FRAME(C_Initialize, nullptr), FRAME(C_Finalize, nullptr), FRAME(C_GetInfo, ANSWER(infores)),
    FRAME(C_GetSlotList, ANSWER(slotlistres)), FRAME(C_GetSlotInfo, ANSWER(slotinfores)),
    FRAME(C_GetTokenInfo, ANSWER(tokeninfores)),
    FRAME(C_GetMechanismList, ANSWER(mechanismlistres)),
    FRAME(C_GetMechanismInfo, ANSWER(mechanisminfores)), FRAME(C_InitToken, nullptr),
    {"C_InitPin", C_InitPin_Server, "C_InitPIN", nullptr},
    {"C_SetPin", C_SetPin_Server, "C_SetPIN", nullptr}, FRAME(C_OpenSession, ANSWER(opensesres)),
    FRAME(C_CloseSession, nullptr), FRAME(C_CloseAllSessions, nullptr),
    FRAME(C_GetSessionInfo, ANSWER(sessioninfores)),
    FRAME(C_GetOperationState, ANSWER(getoperationstateres)), FRAME(C_SetOperationState, nullptr),
    FRAME(C_Login, nullptr), FRAME(C_Logout, nullptr),
    FRAME(C_CreateObject, ANSWER(createobjectres)), FRAME(C_CopyObject, ANSWER(copyobjectres)),
    FRAME(C_DestroyObject, nullptr), FRAME(C_GetObjectSize, ANSWER(getobjectsizeres)),
    FRAME(C_GetAttributeValue, ANSWER(attvalueres)),
    FRAME(C_SetAttributeValue, ANSWER(setattributevalueres)),
    FRAME(C_FindObjectsInit, ANSWER(findobjintres)), FRAME(C_FindObjects, ANSWER(findobjres)),
    FRAME(C_FindObjectsFinal, nullptr), FRAME(C_EncryptInit, nullptr),
    FRAME(C_Encrypt, ANSWER(encres)), FRAME(C_EncryptUpdate, ANSWER(encryptupdateres)),
    FRAME(C_EncryptFinal, ANSWER(encryptfinalres)), FRAME(C_DecryptInit, nullptr),
    FRAME(C_Decrypt, ANSWER(decres)), FRAME(C_DecryptUpdate, ANSWER(decryptupdateres)),
    FRAME(C_DecryptFinal, ANSWER(decryptfinalres)), FRAME(C_DigestInit, nullptr),
    FRAME(C_Digest, ANSWER(digestres)), FRAME(C_DigestUpdate, nullptr), FRAME(C_DigestKey, nullptr),
    FRAME(C_DigestFinal, ANSWER(digestfinalres)), FRAME(C_SignInit, nullptr),
    FRAME(C_Sign, ANSWER(signres)), FRAME(C_SignUpdate, nullptr),
    FRAME(C_SignFinal, ANSWER(signfinalres)), FRAME(C_SignRecoverInit, nullptr),
    FRAME(C_SignRecover, ANSWER(signrecoverres)), FRAME(C_VerifyInit, nullptr),
    FRAME(C_Verify, ANSWER(verifyres)), FRAME(C_VerifyUpdate, nullptr),
    FRAME(C_VerifyFinal, nullptr), FRAME(C_VerifyRecoverInit, nullptr),
    FRAME(C_VerifyRecover, ANSWER(verifyrecoverres)),
    FRAME(C_DigestEncryptUpdate, ANSWER(digestencryptupdateres)),
    FRAME(C_DecryptDigestUpdate, ANSWER(decryptdigestupdateres)),
    FRAME(C_SignEncryptUpdate, ANSWER(signencryptupdateres)),
    FRAME(C_DecryptVerifyUpdate, ANSWER(decryptverifyupdateres)),
    FRAME(C_GenerateKey, ANSWER(generatekeyres)),
    FRAME(C_GenerateKeyPair, ANSWER(generatekeypairres)), FRAME(C_WrapKey, ANSWER(wrapkeyres)),
    {"C_UnWrapKey", C_UnWrapKey_Server, "C_UnwrapKey", ANSWER(unwrapkeyres)},
    {"C_DeriveKey", C_DeriveKey_Server, "C_DeriveKey", ANSWER(derivekeyres), "C_UnDeriveKey"},
    FRAME(C_GenerateRandom, ANSWER(generaterandomres)), FRAME(C_SeedRandom, ANSWER(seedrandomres)),
    FRAME(C_GetFunctionStatus, nullptr), FRAME(C_CancelFunction, nullptr),
    FRAME(C_WaitForSlotEvent, ANSWER(waitforsloteventres)),
};
// clang-format on
#undef FRAME

inline const FrameRow& frameOf(const std::string& command) {
    for (const FrameRow& row : kFrameRows)
        if (command == row.command) return row;
    throw std::out_of_range("no handler for " + command);
}

// The fake module, reset, initialised, with a logged-in read/write user
// session on slot 1 and whatever objects a test creates through it. The
// handlers use it through `ckpFunctions`.
class FakeModuleTest : public ::testing::Test {
protected:
    void SetUp() override {
        fake_vendor_reset();
        module_ = fake_vendor_function_list();
        ckpFunctions = module_;
    }
    void TearDown() override { ckpFunctions = nullptr; }

    CK_SESSION_HANDLE openUserSession() {
        EXPECT_EQ(CKR_OK, module_->C_Initialize(nullptr));
        CK_SESSION_HANDLE session = 0;
        EXPECT_EQ(CKR_OK,
                  module_->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION | CKF_RW_SESSION,
                                         nullptr, nullptr, &session));
        CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN;
        EXPECT_EQ(CKR_OK, module_->C_Login(session, CKU_USER, pin, sizeof pin - 1));
        return session;
    }

    // A session data object with the given label.
    CK_OBJECT_HANDLE createData(CK_SESSION_HANDLE session, const std::string& label) {
        CK_OBJECT_CLASS cls = CKO_DATA;
        CK_ATTRIBUTE tmpl[] = {{CKA_CLASS, &cls, sizeof cls},
                               {CKA_LABEL, const_cast<char*>(label.data()), label.size()}};
        CK_OBJECT_HANDLE object = 0;
        EXPECT_EQ(CKR_OK, module_->C_CreateObject(session, tmpl, 2, &object));
        return object;
    }

    CK_FUNCTION_LIST_PTR module_ = nullptr;
};

}  // namespace servertest

#endif
