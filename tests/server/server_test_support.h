#ifndef VOK_TEST_SERVER_SUPPORT_H
#define VOK_TEST_SERVER_SUPPORT_H

// Shared by the server tests: requests built from a fill function, answers
// parsed back, and a fake module prepared with a user session and objects.

#include <gtest/gtest.h>

#include <functional>
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
