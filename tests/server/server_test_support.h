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
inline const FrameRow kFrameRows[] = {
    {"C_Initialize", C_Initialize_Server, "C_Initialize", nullptr},
    {"C_Finalize", C_Finalize_Server, "C_Finalize", nullptr},
    {"C_GetInfo", C_GetInfo_Server, "C_GetInfo", ANSWER(infores)},
    {"C_GetSlotList", C_GetSlotList_Server, "C_GetSlotList", ANSWER(slotlistres)},
    {"C_GetSlotInfo", C_GetSlotInfo_Server, "C_GetSlotInfo", ANSWER(slotinfores)},
    {"C_GetTokenInfo", C_GetTokenInfo_Server, "C_GetTokenInfo", ANSWER(tokeninfores)},
    {"C_GetMechanismList", C_GetMechanismList_Server, "C_GetMechanismList",
     ANSWER(mechanismlistres)},
    {"C_GetMechanismInfo", C_GetMechanismInfo_Server, "C_GetMechanismInfo",
     ANSWER(mechanisminfores)},
    {"C_InitToken", C_InitToken_Server, "C_InitToken", nullptr},
    {"C_InitPin", C_InitPin_Server, "C_InitPIN", nullptr},
    {"C_SetPin", C_SetPin_Server, "C_SetPIN", nullptr},
    {"C_OpenSession", C_OpenSession_Server, "C_OpenSession", ANSWER(opensesres)},
    {"C_CloseSession", C_CloseSession_Server, "C_CloseSession", nullptr},
    {"C_CloseAllSessions", C_CloseAllSessions_Server, "C_CloseAllSessions", nullptr},
    {"C_GetSessionInfo", C_GetSessionInfo_Server, "C_GetSessionInfo", ANSWER(sessioninfores)},
    {"C_GetOperationState", C_GetOperationState_Server, "C_GetOperationState",
     ANSWER(getoperationstateres)},
    {"C_SetOperationState", C_SetOperationState_Server, "C_SetOperationState", nullptr},
    {"C_Login", C_Login_Server, "C_Login", nullptr},
    {"C_Logout", C_Logout_Server, "C_Logout", nullptr},
    {"C_CreateObject", C_CreateObject_Server, "C_CreateObject", ANSWER(createobjectres)},
    {"C_CopyObject", C_CopyObject_Server, "C_CopyObject", ANSWER(copyobjectres)},
    {"C_DestroyObject", C_DestroyObject_Server, "C_DestroyObject", nullptr},
    {"C_GetObjectSize", C_GetObjectSize_Server, "C_GetObjectSize", ANSWER(getobjectsizeres)},
    {"C_GetAttributeValue", C_GetAttributeValue_Server, "C_GetAttributeValue", ANSWER(attvalueres)},
    {"C_SetAttributeValue", C_SetAttributeValue_Server, "C_SetAttributeValue",
     ANSWER(setattributevalueres)},
    {"C_FindObjectsInit", C_FindObjectsInit_Server, "C_FindObjectsInit", ANSWER(findobjintres)},
    {"C_FindObjects", C_FindObjects_Server, "C_FindObjects", ANSWER(findobjres)},
    {"C_FindObjectsFinal", C_FindObjectsFinal_Server, "C_FindObjectsFinal", nullptr},
    {"C_EncryptInit", C_EncryptInit_Server, "C_EncryptInit", nullptr},
    {"C_Encrypt", C_Encrypt_Server, "C_Encrypt", ANSWER(encres)},
    {"C_EncryptUpdate", C_EncryptUpdate_Server, "C_EncryptUpdate", ANSWER(encryptupdateres)},
    {"C_EncryptFinal", C_EncryptFinal_Server, "C_EncryptFinal", ANSWER(encryptfinalres)},
    {"C_DecryptInit", C_DecryptInit_Server, "C_DecryptInit", nullptr},
    {"C_Decrypt", C_Decrypt_Server, "C_Decrypt", ANSWER(decres)},
    {"C_DecryptUpdate", C_DecryptUpdate_Server, "C_DecryptUpdate", ANSWER(decryptupdateres)},
    {"C_DecryptFinal", C_DecryptFinal_Server, "C_DecryptFinal", ANSWER(decryptfinalres)},
    {"C_DigestInit", C_DigestInit_Server, "C_DigestInit", nullptr},
    {"C_Digest", C_Digest_Server, "C_Digest", ANSWER(digestres)},
    {"C_DigestUpdate", C_DigestUpdate_Server, "C_DigestUpdate", nullptr},
    {"C_DigestKey", C_DigestKey_Server, "C_DigestKey", nullptr},
    {"C_DigestFinal", C_DigestFinal_Server, "C_DigestFinal", ANSWER(digestfinalres)},
    {"C_SignInit", C_SignInit_Server, "C_SignInit", nullptr},
    {"C_Sign", C_Sign_Server, "C_Sign", ANSWER(signres)},
    {"C_SignUpdate", C_SignUpdate_Server, "C_SignUpdate", nullptr},
    {"C_SignFinal", C_SignFinal_Server, "C_SignFinal", ANSWER(signfinalres)},
    {"C_SignRecoverInit", C_SignRecoverInit_Server, "C_SignRecoverInit", nullptr},
    {"C_SignRecover", C_SignRecover_Server, "C_SignRecover", ANSWER(signrecoverres)},
    {"C_VerifyInit", C_VerifyInit_Server, "C_VerifyInit", nullptr},
    {"C_Verify", C_Verify_Server, "C_Verify", ANSWER(verifyres)},
    {"C_VerifyUpdate", C_VerifyUpdate_Server, "C_VerifyUpdate", nullptr},
    {"C_VerifyFinal", C_VerifyFinal_Server, "C_VerifyFinal", nullptr},
    {"C_VerifyRecoverInit", C_VerifyRecoverInit_Server, "C_VerifyRecoverInit", nullptr},
    {"C_VerifyRecover", C_VerifyRecover_Server, "C_VerifyRecover", ANSWER(verifyrecoverres)},
    {"C_DigestEncryptUpdate", C_DigestEncryptUpdate_Server, "C_DigestEncryptUpdate",
     ANSWER(digestencryptupdateres)},
    {"C_DecryptDigestUpdate", C_DecryptDigestUpdate_Server, "C_DecryptDigestUpdate",
     ANSWER(decryptdigestupdateres)},
    {"C_SignEncryptUpdate", C_SignEncryptUpdate_Server, "C_SignEncryptUpdate",
     ANSWER(signencryptupdateres)},
    {"C_DecryptVerifyUpdate", C_DecryptVerifyUpdate_Server, "C_DecryptVerifyUpdate",
     ANSWER(decryptverifyupdateres)},
    {"C_GenerateKey", C_GenerateKey_Server, "C_GenerateKey", ANSWER(generatekeyres)},
    {"C_GenerateKeyPair", C_GenerateKeyPair_Server, "C_GenerateKeyPair",
     ANSWER(generatekeypairres)},
    {"C_WrapKey", C_WrapKey_Server, "C_WrapKey", ANSWER(wrapkeyres)},
    {"C_UnWrapKey", C_UnWrapKey_Server, "C_UnwrapKey", ANSWER(unwrapkeyres)},
    {"C_DeriveKey", C_DeriveKey_Server, "C_DeriveKey", ANSWER(derivekeyres), "C_UnDeriveKey"},
    {"C_GenerateRandom", C_GenerateRandom_Server, "C_GenerateRandom", ANSWER(generaterandomres)},
    {"C_SeedRandom", C_SeedRandom_Server, "C_SeedRandom", ANSWER(seedrandomres)},
    {"C_GetFunctionStatus", C_GetFunctionStatus_Server, "C_GetFunctionStatus", nullptr},
    {"C_CancelFunction", C_CancelFunction_Server, "C_CancelFunction", nullptr},
    {"C_WaitForSlotEvent", C_WaitForSlotEvent_Server, "C_WaitForSlotEvent",
     ANSWER(waitforsloteventres)},
};

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

    // A sensitive secret key, whose CKA_VALUE the module refuses to reveal.
    CK_OBJECT_HANDLE createSensitiveKey(CK_SESSION_HANDLE session) {
        CK_OBJECT_CLASS cls = CKO_SECRET_KEY;
        CK_KEY_TYPE type = CKK_GENERIC_SECRET;
        CK_BBOOL yes = CK_TRUE;
        CK_BYTE value[16] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
        CK_ATTRIBUTE tmpl[] = {{CKA_CLASS, &cls, sizeof cls},
                               {CKA_KEY_TYPE, &type, sizeof type},
                               {CKA_SENSITIVE, &yes, sizeof yes},
                               {CKA_VALUE, value, sizeof value}};
        CK_OBJECT_HANDLE key = 0;
        EXPECT_EQ(CKR_OK, module_->C_CreateObject(session, tmpl, 4, &key));
        return key;
    }

    CK_FUNCTION_LIST_PTR module_ = nullptr;
};

}  // namespace servertest

#endif
