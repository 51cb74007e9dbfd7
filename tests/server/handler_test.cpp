// The handlers against the fake vendor module: what the module receives, and
// the exact answer.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <functional>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "log_capture.h"
#include "server_test_support.h"

namespace {

using namespace servertest;
using ::testing::ElementsAre;
using ::testing::IsSupersetOf;
using Result = pkcs11::OperationResult;

std::string pad(const std::string& text, size_t width) {
    return text + std::string(width - text.size(), ' ');
}

// ---- The frame, for every handler --------------------------------------------

class Frame : public FakeModuleTest, public ::testing::WithParamInterface<FrameRow> {};

// The request carries no sub-message at all: every handler must cope with the
// default instance, and must send its outputs even after a failing call.
TEST_P(Frame, AFailingCallIsAnsweredWithItsResultAndOutputs) {
    const FrameRow& row = GetParam();
    const CK_RV failure = CKR_VENDOR_DEFINED | 0x5a;
    ASSERT_EQ(CKR_OK, fake_vendor_set_next_rv(row.moduleFunction, failure));
    const char* name = row.answeredAs ? row.answeredAs : row.command;
    Result res = parsed(row.handler(requestBytes(row.command)));
    EXPECT_EQ(name, res.name());
    EXPECT_EQ(failure, res.result());
    EXPECT_TRUE(!row.answer || row.answer(res)) << "answer sub-message missing";
    EXPECT_EQ(bareAnswer(name, failure), res.SerializeAsString()) << "unexpected field";
    std::vector<fakevendor::Call> calls = fakevendor::calls();
    ASSERT_EQ(1u, calls.size());
    EXPECT_EQ(row.moduleFunction, calls[0].function);
}

TEST_P(Frame, WithoutAModuleTheAnswerIsEmpty) {
    ckpFunctions = nullptr;
    EXPECT_EQ("", GetParam().handler(requestBytes(GetParam().command)));
    EXPECT_EQ(0u, fake_vendor_call_count());
}

INSTANTIATE_TEST_SUITE_P(Handlers, Frame, ::testing::ValuesIn(kFrameRows),
                         [](const auto& info) { return std::string(info.param.command); });

// ---- What the module receives --------------------------------------------------

// Expected lines of the fake's record: "<name> <null> <number> <hex|-> <items> [<type> <null>
// <len> <hex|->]...".
struct ReceiveRow {
    const char* label;
    const char* command;
    Fill fill;
    std::vector<std::string> lines;
    // Set: the module fails at once, and the answer is exactly this (with name
    // and result): the service's own buffers as passed, handles as they stand.
    std::function<void(Result&)> answer = {};
};

constexpr CK_RV kFailure = CKR_VENDOR_DEFINED | 0x5a;

void PrintTo(const ReceiveRow& row, std::ostream* os) { *os << row.label; }

void attribute(google::protobuf::RepeatedPtrField<pkcs11::CK_ATTRIBUTE>* list, CK_ULONG type,
               const std::optional<std::string>& value, CK_ULONG length) {
    pkcs11::CK_ATTRIBUTE* a = list->Add();
    a->set_type(type);
    if (value) a->set_pvalue(*value);
    a->set_ulvaluelen(length);
}

const ReceiveRow kReceiveRows[] = {
    {"InitializeAlwaysWithoutArguments", "C_Initialize",
     [](auto& op) { op.mutable_initialize()->set_flags(true); },
     {"pInitArgs 1 0 - 0"}},
    {"SlotListWithoutEntriesIsALengthQuery", "C_GetSlotList",
     [](auto& op) {
         op.mutable_slotlist()->set_tokenpresent(true), op.mutable_slotlist()->set_pulcount(4);
     },
     {"tokenPresent 1 1 - 0", "pSlotList 1 0 - 0", "pulCount 0 4 - 0"}},
    {"SlotListEntriesAskForACapacityBuffer", "C_GetSlotList",
     [](auto& op) {
         auto* m = op.mutable_slotlist();
         m->add_slotidlist(7), m->add_slotidlist(7), m->set_pulcount(4);
     },
     {"pSlotList 0 0 " + zeros(32) + " 0", "pulCount 0 4 - 0"}},
    {"LoginPinShorterThanItsLengthEndsInZeros", "C_Login",
     [](auto& op) { op.mutable_login()->set_ppin("12"), op.mutable_login()->set_ulpinlen(4); },
     {"pPin 0 0 31320000 0", "ulPinLen 1 4 - 0"}},
    {"LoginPinLongerThanItsLengthIsCut", "C_Login",
     [](auto& op) { op.mutable_login()->set_ppin("123456"), op.mutable_login()->set_ulpinlen(3); },
     {"pPin 0 0 313233 0", "ulPinLen 1 3 - 0"}},
    {"InitTokenLabelIsBlankPadded", "C_InitToken",
     [](auto& op) {
         auto* m = op.mutable_inittoken();
         m->set_slotid(1), m->set_ppin("5678"), m->set_ulpinlen(4), m->set_plabel("new");
     },
     {"slotID 1 1 - 0", "pPin 0 0 35363738 0",
      "pLabel 0 0 6e6577" + hex(std::string(29, ' ')) + " 0"}},
    {"SetPinBothPins", "C_SetPin",
     [](auto& op) {
         auto* m = op.mutable_setpin();
         m->set_poldpin("1234"), m->set_uloldlen(4), m->set_pnewpin("87"), m->set_ulnewlen(2);
     },
     {"pOldPin 0 0 31323334 0", "ulOldLen 1 4 - 0", "pNewPin 0 0 3837 0", "ulNewLen 1 2 - 0"}},
    {"OpenSessionNeverPassesACallback", "C_OpenSession",
     [](auto& op) {
         op.mutable_openses()->set_slotid(1),
             op.mutable_openses()->set_flags(CKF_SERIAL_SESSION | CKF_RW_SESSION);
     },
     {"slotID 1 1 - 0", "flags 1 6 - 0", "pApplication 1 0 - 0", "Notify 1 0 - 0",
      "phSession 0 0 - 0"}},
    {"SetOperationStateShortStateEndsInZeros", "C_SetOperationState",
     [](auto& op) {
         auto* m = op.mutable_setoperationstate();
         m->set_poperationstate("ab"), m->set_uloperationstatelen(4), m->set_hencryptionkey(7),
             m->set_hauthenticationkey(8);
     },
     {"pOperationState 0 0 61620000 0", "ulOperationStateLen 1 4 - 0", "hEncryptionKey 1 7 - 0",
      "hAuthenticationKey 1 8 - 0"}},
    // Values shorter than stated end in zeros; entries beyond the list are zero;
    // an attribute without a value passes NULL with its length.
    {"CreateObjectTemplate", "C_CreateObject",
     [](auto& op) {
         auto* m = op.mutable_createobject();
         attribute(m->mutable_ptemplate(), CKA_LABEL, "ab", 4);
         attribute(m->mutable_ptemplate(), CKA_APPLICATION, std::nullopt, 5);
         m->set_hsession(1), m->set_ulcount(3);
     },
     {"pTemplate 0 0 - 3 3 0 4 61620000 16 1 5 - 0 1 0 -", "ulCount 1 3 - 0"}},
    {"FindObjectsInitAlwaysPassesAValueBuffer", "C_FindObjectsInit",
     [](auto& op) {
         attribute(op.mutable_findobjinit()->mutable_attribute(), CKA_LABEL, std::nullopt, 2);
         op.mutable_findobjinit()->set_ulcount(1);
     },
     {"pTemplate 0 0 - 1 3 0 2 0000", "ulCount 1 1 - 0"}},
    {"FindObjectsWithMaximumZeroStillPassesABuffer", "C_FindObjects",
     [](auto& op) { op.mutable_findobj()->set_hsession(1); },
     {"hSession 1 1 - 0", "phObject 0 0 - 0", "ulMaxObjectCount 1 0 - 0",
      "pulObjectCount 0 0 - 0"}},
    // Deliberately: the signature sent never reaches the module, which checks
    // zeros of its length, and those come back.
    {"VerifyFailingStillAnswers", "C_Verify",
     [](auto& op) {
         auto* m = op.mutable_verify();
         m->set_pdata("abc"), m->set_uldatalen(4), m->set_psignature("sigX");
         m->set_ulsignaturelen(4);
     },
     {"pData 0 0 61626300 0", "ulDataLen 1 4 - 0", "pSignature 0 0 00000000 0",
      "ulSignatureLen 1 4 - 0"},
     [](Result& r) {
         r.mutable_verifyres()->set_psignature(std::string(4, '\0'));
         r.mutable_verifyres()->set_ulsignaturelen(4);
     }},
    {"WrapKeyFailingStillAnswers", "C_WrapKey",
     [](auto& op) {
         auto* m = op.mutable_wrapkey();
         m->set_hwrappingkey(5), m->set_hkey(6), m->set_pwrappedkey("ab");
         m->set_pulwrappedkeylen(4);
     },
     {"hWrappingKey 1 5 - 0", "hKey 1 6 - 0", "pWrappedKey 0 0 61620000 0",
      "pulWrappedKeyLen 0 4 - 0"},
     [](Result& r) {
         r.mutable_wrapkeyres()->set_pwrappedkey(std::string("ab\0\0", 4));
         r.mutable_wrapkeyres()->set_pulwrappedkeylen(4);
     }},
    {"GenerateKeyPairFailingStillAnswers", "C_GenerateKeyPair",
     [](auto& op) {
         auto* m = op.mutable_generatekeypair();
         attribute(m->mutable_ppublickeytemplate(), CKA_LABEL, "pub", 3);
         attribute(m->mutable_pprivatekeytemplate(), CKA_LABEL, "pr", 3);
         m->set_ulpublickeyattributecount(1), m->set_ulprivatekeyattributecount(2);
     },
     {"pPublicKeyTemplate 0 0 - 1 3 0 3 707562", "ulPublicKeyAttributeCount 1 1 - 0",
      "pPrivateKeyTemplate 0 0 - 2 3 0 3 707200 0 1 0 -", "ulPrivateKeyAttributeCount 1 2 - 0"},
     [](Result& r) {
         r.mutable_generatekeypairres()->set_phpublickey(0);
         r.mutable_generatekeypairres()->set_phprivatekey(0);
     }},
    {"GenerateRandomFailingStillAnswers", "C_GenerateRandom",
     [](auto& op) {
         op.mutable_generaterandom()->set_randomdata("ab");
         op.mutable_generaterandom()->set_ulrandomlen(4);
     },
     {"RandomData 0 0 61620000 0", "ulRandomLen 1 4 - 0"},
     [](Result& r) {
         r.mutable_generaterandomres()->set_randomdata(std::string("ab\0\0", 4));
         r.mutable_generaterandomres()->set_ulrandomlen(4);
     }},
    {"SeedRandomFailingStillAnswers", "C_SeedRandom",
     [](auto& op) {
         op.mutable_seedrandom()->set_pseed("seedXX"), op.mutable_seedrandom()->set_ulseedlen(4);
     },
     {"pSeed 0 0 73656564 0", "ulSeedLen 1 4 - 0"},
     [](Result& r) {
         r.mutable_seedrandomres()->set_pseed("seed"), r.mutable_seedrandomres()->set_ulseedlen(4);
     }},
    {"WaitForSlotEventFailingStillAnswers", "C_WaitForSlotEvent",
     [](auto& op) {
         op.mutable_waitforslotevent()->set_flags(CKF_DONT_BLOCK);
         op.mutable_waitforslotevent()->set_presearved(std::string(8, '\x7f'));
     },
     {"flags 1 1 - 0", "pSlot 0 0 - 0", "pReserved 1 0 - 0"},
     [](Result& r) { r.mutable_waitforsloteventres()->set_pslot(0); }},
};

class ModuleReceives : public FakeModuleTest, public ::testing::WithParamInterface<ReceiveRow> {};

TEST_P(ModuleReceives, WhatTheRequestSays) {
    const ReceiveRow& row = GetParam();
    const FrameRow& frame = frameOf(row.command);
    if (row.answer) {
        ASSERT_EQ(CKR_OK, fake_vendor_set_next_rv(frame.moduleFunction, kFailure));
    }
    const std::string answer = frame.handler(requestBytes(row.command, row.fill));
    EXPECT_THAT(received(frame.moduleFunction), IsSupersetOf(row.lines))
        << fakevendor::lastCall(frame.moduleFunction);
    if (!row.answer) return;
    Result expected;
    expected.set_name(row.command), expected.set_result(kFailure);
    row.answer(expected);
    EXPECT_EQ(hex(expected.SerializeAsString()), hex(answer));
}

INSTANTIATE_TEST_SUITE_P(Handlers, ModuleReceives, ::testing::ValuesIn(kReceiveRows),
                         [](const auto& info) { return std::string(info.param.label); });

// ---- The exact answer ---------------------------------------------------------

constexpr CK_OBJECT_HANDLE kLabelOne = FAKE_VENDOR_FIRST_OBJECT_HANDLE;  // "label-one"
constexpr CK_SESSION_HANDLE kSession = 1;

struct AnswerRow {
    const char* label;
    void (*patch)(CK_FUNCTION_LIST&);  // a misbehaving module; nullptr: the fake as it is
    const char* command;
    Fill fill;
    CK_RV rv;
    std::function<void(Result&)> expect;  // everything but name and result
};

void PrintTo(const AnswerRow& row, std::ostream* os) { *os << row.label; }

void version(pkcs11::CK_VERSION* v, int major, int minor) {
    v->set_vermajor(major), v->set_verminor(minor);
}

void getLabel(pkcs11::Operation& op, CK_OBJECT_HANDLE object,
              const std::optional<std::string>& value, CK_ULONG length) {
    auto* m = op.mutable_attvalue();
    m->set_hsession(kSession), m->set_hobject(object), m->set_ulcount(1);
    attribute(m->mutable_attribute(), CKA_LABEL, value, length);
}

// Misbehaving modules: they report more than they were given room for, or
// mark a value unavailable.
CK_RV overReportedList(CK_ULONG_PTR list, CK_ULONG_PTR count) {
    for (CK_ULONG i = 0; list && i < *count; ++i) list[i] = 100 + i;
    *count = 1000;
    return CKR_OK;
}
void overReportSlots(CK_FUNCTION_LIST& l) {
    l.C_GetSlotList = [](CK_BBOOL, CK_SLOT_ID_PTR list, CK_ULONG_PTR n) {
        return overReportedList(list, n);
    };
}
void overReportFound(CK_FUNCTION_LIST& l) {
    l.C_FindObjects = [](CK_SESSION_HANDLE, CK_OBJECT_HANDLE_PTR handles, CK_ULONG max,
                         CK_ULONG_PTR found) -> CK_RV {
        for (CK_ULONG i = 0; i < max; ++i) handles[i] = 7;
        *found = max + 1;
        return CKR_OK;
    };
}
void overReportState(CK_FUNCTION_LIST& l) {
    l.C_GetOperationState = [](CK_SESSION_HANDLE, CK_BYTE_PTR state, CK_ULONG_PTR length) -> CK_RV {
        memset(state, 'S', *length);
        *length = 1000;
        return CKR_OK;
    };
}
void overReportValue(CK_FUNCTION_LIST& l) {
    l.C_GetAttributeValue = [](CK_SESSION_HANDLE, CK_OBJECT_HANDLE, CK_ATTRIBUTE_PTR t,
                               CK_ULONG n) -> CK_RV {
        for (CK_ULONG i = 0; i < n; ++i)
            memset(t[i].pValue, 'v', t[i].ulValueLen), t[i].ulValueLen = 100;
        return CKR_OK;
    };
}
void foundTwo(CK_FUNCTION_LIST& l) {
    l.C_FindObjects = [](CK_SESSION_HANDLE, CK_OBJECT_HANDLE_PTR handles, CK_ULONG max,
                         CK_ULONG_PTR found) -> CK_RV {
        *found = std::min<CK_ULONG>(max, 2);
        for (CK_ULONG i = 0; i < *found; ++i) handles[i] = 70 + i;
        return CKR_OK;
    };
}
CK_RV markUnavailable(CK_ATTRIBUTE_PTR t, CK_ULONG n) {
    for (CK_ULONG i = 0; i < n; ++i) t[i].ulValueLen = CK_UNAVAILABLE_INFORMATION;
    return CKR_ATTRIBUTE_TYPE_INVALID;
}
void unavailableInSearch(CK_FUNCTION_LIST& l) {
    l.C_FindObjectsInit = [](CK_SESSION_HANDLE, CK_ATTRIBUTE_PTR t, CK_ULONG n) {
        return markUnavailable(t, n);
    };
}
void unavailableInSet(CK_FUNCTION_LIST& l) {
    l.C_SetAttributeValue = [](CK_SESSION_HANDLE, CK_OBJECT_HANDLE, CK_ATTRIBUTE_PTR t,
                               CK_ULONG n) { return markUnavailable(t, n); };
}
void sensitiveValue(CK_FUNCTION_LIST& l) {
    l.C_GetAttributeValue = [](CK_SESSION_HANDLE, CK_OBJECT_HANDLE, CK_ATTRIBUTE_PTR t,
                               CK_ULONG n) -> CK_RV {
        markUnavailable(t, n);
        return CKR_ATTRIBUTE_SENSITIVE;
    };
}

const std::string kVendor = pad("Vok test vendor", 32);

const AnswerRow kAnswerRows[] = {
    {"InfoTextsRunOnToTheFirstZeroOrTheEnd",
     nullptr, "C_GetInfo",
     {},
     CKR_OK,
     [](Result& r) {
         auto* i = r.mutable_infores()->mutable_ckinfo();
         version(i->mutable_cryptokiversion(), 2, 40);
         i->set_manufacturerid(kVendor), i->set_flags(0);
         i->set_librarydescription(pad("Fake vendor module", 32) + "\x01\x02");
         version(i->mutable_libraryversion(), 1, 2);
     }},
    {"SlotListLengthQueryCountsTheSlots", nullptr, "C_GetSlotList",
     [](auto& op) { op.mutable_slotlist(); }, CKR_OK,
     [](Result& r) { r.mutable_slotlistres()->set_pulcount(2); }},
    {"SlotListOfCapacityFourOnTwoSlots", nullptr, "C_GetSlotList",
     [](auto& op) {
         for (int i = 0; i < 4; ++i) op.mutable_slotlist()->add_slotidlist(0);
         op.mutable_slotlist()->set_pulcount(4);
     },
     CKR_OK,
     [](Result& r) {
         auto* l = r.mutable_slotlistres();
         l->add_slotidlist(1), l->add_slotidlist(2), l->set_pulcount(2);
     }},
    {"SlotListTooSmallStillSendsCountAndEntries", nullptr, "C_GetSlotList",
     [](auto& op) {
         op.mutable_slotlist()->add_slotidlist(9), op.mutable_slotlist()->set_pulcount(1);
     },
     CKR_BUFFER_TOO_SMALL,
     [](Result& r) {
         r.mutable_slotlistres()->add_slotidlist(0), r.mutable_slotlistres()->set_pulcount(2);
     }},
    {"SlotListOverReportedIsCutAtTheAllocation", overReportSlots, "C_GetSlotList",
     [](auto& op) {
         op.mutable_slotlist()->add_slotidlist(0), op.mutable_slotlist()->set_pulcount(2);
     },
     CKR_OK,
     [](Result& r) {
         auto* l = r.mutable_slotlistres();
         l->add_slotidlist(100), l->add_slotidlist(101), l->set_pulcount(1000);
     }},
    {"OperationStateOverReportedIsCutAtTheAllocation", overReportState, "C_GetOperationState",
     [](auto& op) {
         op.mutable_getoperationstate()->set_poperationstate("");
         op.mutable_getoperationstate()->set_puloperationstatelen(3);
     },
     CKR_OK,
     [](Result& r) {
         r.mutable_getoperationstateres()->set_poperationstate("SSS");
         r.mutable_getoperationstateres()->set_puloperationstatelen(1000);
     }},
    {"AttributeWithoutValueGetsItsLength", nullptr, "C_GetAttributeValue", [](auto& op) { getLabel(op, kLabelOne, std::nullopt, 0); }, CKR_OK,
     [](Result& r) {
         attribute(r.mutable_attvalueres()->mutable_attribute(), CKA_LABEL, std::nullopt, 9);
         r.mutable_attvalueres()->set_ulcount(1);
     }},
    {"SensitiveAttributeComesBackAsTypeOnly", sensitiveValue, "C_GetAttributeValue",
     [](auto& op) {
         getLabel(op, kLabelOne, "xxxxxxxxxxxxxxxx", 16);
         op.mutable_attvalue()->mutable_attribute(0)->set_type(CKA_VALUE);
     },
     CKR_ATTRIBUTE_SENSITIVE,
     [](Result& r) {
         r.mutable_attvalueres()->add_attribute()->set_type(CKA_VALUE);
         r.mutable_attvalueres()->set_ulcount(1);
     }},
    {"AttributeLengthOverReportedIsCutAtTheBuffer", overReportValue, "C_GetAttributeValue", [](auto& op) { getLabel(op, kLabelOne, "xxxx", 4); }, CKR_OK,
     [](Result& r) {
         attribute(r.mutable_attvalueres()->mutable_attribute(), CKA_LABEL, "vvvv", 100);
         r.mutable_attvalueres()->set_ulcount(1);
     }},
    {"SetAttributeValueEchoesTheTemplate", nullptr, "C_SetAttributeValue",
     [](auto& op) {
         auto* m = op.mutable_setattributevalue();
         attribute(m->mutable_ptemplate(), CKA_LABEL, "renamed", 7);
         m->set_hsession(kSession), m->set_hobject(kLabelOne), m->set_ulcount(1);
     },
     CKR_OK,
     [](Result& r) {
         attribute(r.mutable_setattributevalueres()->mutable_ptemplate(), CKA_LABEL, "renamed", 7);
         r.mutable_setattributevalueres()->set_ulcount(1);
     }},
    {"SetAttributeValueDropsAnUnavailableLength", unavailableInSet, "C_SetAttributeValue",
     [](auto& op) {
         attribute(op.mutable_setattributevalue()->mutable_ptemplate(), CKA_LABEL, "ab", 2);
         op.mutable_setattributevalue()->set_ulcount(1);
     },
     CKR_ATTRIBUTE_TYPE_INVALID,
     [](Result& r) {
         r.mutable_setattributevalueres()->add_ptemplate()->set_type(CKA_LABEL);
         r.mutable_setattributevalueres()->set_ulcount(1);
     }},
    {"FindObjectsInitEchoesEveryValue", nullptr, "C_FindObjectsInit",
     [](auto& op) {
         attribute(op.mutable_findobjinit()->mutable_attribute(), CKA_LABEL, std::nullopt, 3);
         op.mutable_findobjinit()->set_hsession(kSession), op.mutable_findobjinit()->set_ulcount(1);
     },
     CKR_OK,
     [](Result& r) {
         auto* a = r.mutable_findobjintres()->add_attribute();
         a->set_type(CKA_LABEL), a->set_pvalue(std::string(3, '\0')), a->set_ulvaluelen(3);
         r.mutable_findobjintres()->set_ulcount(1);
     }},
    {"FindObjectsInitEchoesAnUnavailableLengthVerbatim", unavailableInSearch, "C_FindObjectsInit",
     [](auto& op) {
         attribute(op.mutable_findobjinit()->mutable_attribute(), CKA_LABEL, "ab", 2);
         op.mutable_findobjinit()->set_ulcount(1);
     },
     CKR_ATTRIBUTE_TYPE_INVALID,
     [](Result& r) {
         attribute(r.mutable_findobjintres()->mutable_attribute(), CKA_LABEL, "ab",
                   CK_UNAVAILABLE_INFORMATION);
         r.mutable_findobjintres()->set_ulcount(1);
     }},
    {"FindObjectsSendsTheFoundHandlesOnly", foundTwo, "C_FindObjects",
     [](auto& op) { op.mutable_findobj()->set_ulmaxobjectcount(4); }, CKR_OK,
     [](Result& r) {
         auto* f = r.mutable_findobjres();
         f->add_phobject(70), f->add_phobject(71), f->set_pulobjectcount(2);
     }},
    {"FindObjectsOverReportedSendsNoHandles", overReportFound, "C_FindObjects", [](auto& op) { op.mutable_findobj()->set_ulmaxobjectcount(3); }, CKR_OK,
     [](Result& r) { r.mutable_findobjres()->set_pulobjectcount(4); }},
};

// Slot 1 holds "label-one", seen through a logged-in read/write session;
// there are two slots.
class PreparedToken : public FakeModuleTest {
protected:
    void SetUp() override {
        FakeModuleTest::SetUp();
        fake_vendor_set_slot_count(2);
        const CK_SESSION_HANDLE session = openUserSession();
        createData(session, "label-one");
        fake_vendor_clear_calls();
    }
};

class Answers : public PreparedToken, public ::testing::WithParamInterface<AnswerRow> {};

TEST_P(Answers, Exactly) {
    const AnswerRow& row = GetParam();
    CK_FUNCTION_LIST patched = *module_;
    if (row.patch) row.patch(patched), ckpFunctions = &patched;
    Result expected;
    expected.set_name(row.command);
    expected.set_result(row.rv);
    row.expect(expected);
    const std::string answer = frameOf(row.command).handler(requestBytes(row.command, row.fill));
    EXPECT_EQ(hex(expected.SerializeAsString()), hex(answer));
}

INSTANTIATE_TEST_SUITE_P(Handlers, Answers, ::testing::ValuesIn(kAnswerRows),
                         [](const auto& info) { return std::string(info.param.label); });

// ---- Every field of the information structures ---------------------------------

// A module that fills every byte of a structure with its offset's own
// non-zero value: each number and version comes from its own place, and each
// text runs on, but not past the end.
char patternAt(size_t i) { return static_cast<char>(0x21 + i % 94); }
template <class T>
CK_RV fillPattern(T* out) {
    for (size_t i = 0; i < sizeof(T); ++i) reinterpret_cast<char*>(out)[i] = patternAt(i);
    return CKR_OK;
}

std::string str(const std::string& text) { return text; }
std::string str(uint64_t number) { return std::to_string(number); }
std::string str(const pkcs11::CK_VERSION& v) {
    return std::to_string(v.vermajor()) + "." + std::to_string(v.verminor());
}

struct InfoField {
    const char* command;
    const char* member;
    size_t size, offset;
    char kind;  // 'T' text, 'U' CK_ULONG, 'V' version
    std::string (*got)(const Result&);
};
// clang-format off
#define INFO(command, S, res, member, kind, field)                                   \
    InfoField{command, #member, sizeof(S), offsetof(S, member), kind,                 \
              [](const Result& r) { return str(r.res().field()); }}
#define TOKEN(member, kind, field) \
    INFO("C_GetTokenInfo", CK_TOKEN_INFO, tokeninfores().pinfo, member, kind, field)
const InfoField kInfoFields[] = {
    INFO("C_GetInfo", CK_INFO, infores().ckinfo, cryptokiVersion, 'V', cryptokiversion),
    INFO("C_GetInfo", CK_INFO, infores().ckinfo, manufacturerID, 'T', manufacturerid),
    INFO("C_GetInfo", CK_INFO, infores().ckinfo, flags, 'U', flags),
    INFO("C_GetInfo", CK_INFO, infores().ckinfo, libraryDescription, 'T', librarydescription),
    INFO("C_GetInfo", CK_INFO, infores().ckinfo, libraryVersion, 'V', libraryversion),
    INFO("C_GetSlotInfo", CK_SLOT_INFO, slotinfores().pinfo, slotDescription, 'T', slotdescription),
    INFO("C_GetSlotInfo", CK_SLOT_INFO, slotinfores().pinfo, manufacturerID, 'T', manufacturerid),
    INFO("C_GetSlotInfo", CK_SLOT_INFO, slotinfores().pinfo, flags, 'U', flags),
    INFO("C_GetSlotInfo", CK_SLOT_INFO, slotinfores().pinfo, hardwareVersion, 'V', hardwareversion),
    INFO("C_GetSlotInfo", CK_SLOT_INFO, slotinfores().pinfo, firmwareVersion, 'V', firmwareversion),
    TOKEN(label, 'T', label), TOKEN(manufacturerID, 'T', manufacturerid), TOKEN(model, 'T', model),
    TOKEN(serialNumber, 'T', serialnumber), TOKEN(flags, 'U', flags),
    TOKEN(ulMaxSessionCount, 'U', ulmaxsessioncount), TOKEN(ulSessionCount, 'U', ulsessioncount),
    TOKEN(ulMaxRwSessionCount, 'U', ulmaxrwsessioncount),
    TOKEN(ulRwSessionCount, 'U', ulrwsessioncount), TOKEN(ulMaxPinLen, 'U', ulmaxpinlen),
    TOKEN(ulMinPinLen, 'U', ulminpinlen), TOKEN(ulTotalPublicMemory, 'U', ultotalpublicmemory),
    TOKEN(ulFreePublicMemory, 'U', ulfreepublicmemory),
    TOKEN(ulTotalPrivateMemory, 'U', ultotalprivatememory),
    TOKEN(ulFreePrivateMemory, 'U', ulfreeprivatememory),
    TOKEN(hardwareVersion, 'V', hardwareversion), TOKEN(firmwareVersion, 'V', firmwareversion),
    TOKEN(utcTime, 'T', utctime),
    INFO("C_GetSessionInfo", CK_SESSION_INFO, sessioninfores().pinfo, slotID, 'U', slotid),
    INFO("C_GetSessionInfo", CK_SESSION_INFO, sessioninfores().pinfo, state, 'U', state),
    INFO("C_GetSessionInfo", CK_SESSION_INFO, sessioninfores().pinfo, flags, 'U', flags),
    INFO("C_GetSessionInfo", CK_SESSION_INFO, sessioninfores().pinfo, ulDeviceError, 'U', uldeviceerror),
    INFO("C_GetMechanismInfo", CK_MECHANISM_INFO, mechanisminfores().pinfo, ulMinKeySize, 'U', ulminkeysize),
    INFO("C_GetMechanismInfo", CK_MECHANISM_INFO, mechanisminfores().pinfo, ulMaxKeySize, 'U', ulmaxkeysize),
    INFO("C_GetMechanismInfo", CK_MECHANISM_INFO, mechanisminfores().pinfo, flags, 'U', flags),
};
#undef TOKEN
#undef INFO
// clang-format on

TEST_F(PreparedToken, EveryInfoFieldComesBackFromItsOwnPlace) {
    static CK_FUNCTION_LIST patched;
    patched = *module_;
    patched.C_GetInfo = [](CK_INFO_PTR out) { return fillPattern(out); };
    patched.C_GetSlotInfo = [](CK_SLOT_ID, CK_SLOT_INFO_PTR out) { return fillPattern(out); };
    patched.C_GetTokenInfo = [](CK_SLOT_ID, CK_TOKEN_INFO_PTR out) { return fillPattern(out); };
    patched.C_GetSessionInfo = [](CK_SESSION_HANDLE, CK_SESSION_INFO_PTR out) {
        return fillPattern(out);
    };
    patched.C_GetMechanismInfo = [](CK_SLOT_ID, CK_MECHANISM_TYPE, CK_MECHANISM_INFO_PTR out) {
        return fillPattern(out);
    };
    ckpFunctions = &patched;
    for (const InfoField& f : kInfoFields) {
        std::string bytes(f.size, '\0');
        for (size_t i = 0; i < f.size; ++i) bytes[i] = patternAt(i);
        std::string expected = bytes.substr(f.offset);
        if (f.kind == 'U') {
            CK_ULONG number = 0;
            memcpy(&number, &bytes[f.offset], sizeof number);
            expected = std::to_string(number);
        } else if (f.kind == 'V') {
            expected = std::to_string(bytes[f.offset]) + "." + std::to_string(bytes[f.offset + 1]);
        }
        const Result res = parsed(frameOf(f.command).handler(requestBytes(f.command)));
        EXPECT_EQ(expected, f.got(res)) << f.command << " " << f.member;
    }
}

TEST_F(PreparedToken, OpenSessionLogsTheHandleUnderItsOwnTag) {
    voktest::LogCapture log;
    C_OpenSession_Server(requestBytes("C_OpenSession", [](auto& op) {
        op.mutable_openses()->set_slotid(1), op.mutable_openses()->set_flags(CKF_SERIAL_SESSION);
    }));
    ASSERT_EQ(CKR_OK, fake_vendor_set_next_rv("C_OpenSession", CKR_SLOT_ID_INVALID));
    C_OpenSession_Server(requestBytes("C_OpenSession"));
    EXPECT_THAT(
        log.lines(),
        IsSupersetOf({
            voktest::LogLine{"DDDD", 3,
                             "session is 2 and CK_ULONG size is 8, CK_SESSION_HANDLE size is 8"},
            voktest::LogLine{"DDDD", 3,
                             "session is 0 and CK_ULONG size is 8, CK_SESSION_HANDLE size is 8"},
        }));
    EXPECT_THAT(log.texts("Vokpkcs11f_Server"),
                ElementsAre("ckpFunctions not null", "Opensession instance present",
                            "ckpFunctions not null", "session from open session null"));
}

}  // namespace
