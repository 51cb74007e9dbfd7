#ifndef VOK_TEST_FAKE_VENDOR_FIXTURE_H
#define VOK_TEST_FAKE_VENDOR_FIXTURE_H

#include <gtest/gtest.h>

#include <deque>
#include <string>
#include <vector>

#include "fake_vendor.h"

namespace fakevendor {

using Bytes = std::vector<CK_BYTE>;

inline Bytes bytes(const std::string& s) { return Bytes(s.begin(), s.end()); }

// A template whose values live as long as it does.
class Template {
public:
    Template& add(CK_ATTRIBUTE_TYPE type, const void* value, CK_ULONG size) {
        const auto* p = static_cast<const CK_BYTE*>(value);
        values_.push_back(p ? Bytes(p, p + size) : Bytes());
        attrs_.push_back({type, value ? values_.back().data() : nullptr, size});
        return *this;
    }
    Template& ulong(CK_ATTRIBUTE_TYPE type, CK_ULONG v) { return add(type, &v, sizeof v); }
    Template& text(CK_ATTRIBUTE_TYPE type, const std::string& v) {
        return add(type, v.data(), v.size());
    }
    CK_ATTRIBUTE_PTR data() { return attrs_.data(); }
    CK_ULONG count() const { return attrs_.size(); }

private:
    std::deque<Bytes> values_;
    std::vector<CK_ATTRIBUTE> attrs_;
};

// A fresh, initialised token with one read-write session open.
class FakeVendorTest : public ::testing::Test {
public:
    const Bytes aesValue = bytes("0123456789abcdef");
    CK_FUNCTION_LIST_PTR f = fake_vendor_function_list();
    CK_SESSION_HANDLE session = CK_INVALID_HANDLE;

    void SetUp() override {
        fake_vendor_reset();
        ASSERT_EQ(f->C_Initialize(nullptr), CKR_OK);
        ASSERT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION | CKF_RW_SESSION,
                                   nullptr, nullptr, &session),
                  CKR_OK);
    }


    CK_OBJECT_HANDLE create(Template& t) {
        CK_OBJECT_HANDLE h = CK_INVALID_HANDLE;
        EXPECT_EQ(f->C_CreateObject(session, t.data(), t.count(), &h), CKR_OK);
        return h;
    }

    CK_OBJECT_HANDLE aesKey() {
        Template t;
        t.ulong(CKA_CLASS, CKO_SECRET_KEY).ulong(CKA_KEY_TYPE, CKK_AES);
        t.add(CKA_VALUE, aesValue.data(), aesValue.size());
        return create(t);
    }
};

inline CK_MECHANISM mechanism(CK_MECHANISM_TYPE type) { return {type, nullptr, 0}; }

}  // namespace fakevendor

#endif
