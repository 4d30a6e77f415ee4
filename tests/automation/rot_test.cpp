#include "automation/rot.h"

#include "RecordingSink.h"

#include <gtest/gtest.h>

namespace {

constexpr CLSID CLSID_Here = {0x1111, 0, 0, {2, 2, 2, 2, 2, 2, 2, 2}};
constexpr CLSID CLSID_Elsewhere = {0x2222, 0, 0, {2, 2, 2, 2, 2, 2, 2, 2}};
constexpr IID DIID_Unused = {0x3333, 0, 0, {2, 2, 2, 2, 2, 2, 2, 2}};

// Another source of running objects (as a bridge to another process would be).
class FakeSource final : public IRunningObjectSource {
public:
    explicit FakeSource(IUnknown* object) : m_object(object) {}
    HRESULT GetObject(REFCLSID clsid, IUnknown** object) override {
        ++asked;
        if (!(clsid == CLSID_Elsewhere)) return MK_E_UNAVAILABLE;
        *object = CComPtr<IUnknown>(m_object).Detach();
        return S_OK;
    }
    int asked = 0;

private:
    CComPtr<IUnknown> m_object;
};

}  // namespace

TEST(RunningObjectTable, RegisterFindRevoke) {
    auto object = MakeComObject<RecordingSink>(DIID_Unused);
    DWORD registration = 0;
    ASSERT_EQ(RegisterActiveObject(object.Get(), CLSID_Here, &registration), S_OK);
    EXPECT_NE(registration, 0u);
    EXPECT_EQ(object->RefCount(), 2u);  // the table holds one

    CComPtr<IUnknown> found;
    ASSERT_EQ(GetActiveObject(CLSID_Here, found.Receive()), S_OK);
    EXPECT_EQ(static_cast<IUnknown*>(static_cast<IDispatch*>(object.Get())), found.Get());
    found.Release();

    EXPECT_EQ(GetActiveObject(CLSID_Elsewhere, found.Receive()), MK_E_UNAVAILABLE);
    EXPECT_FALSE(found);
    EXPECT_EQ(RevokeActiveObject(registration), S_OK);
    EXPECT_EQ(RevokeActiveObject(registration), E_INVALIDARG);
    EXPECT_EQ(object->RefCount(), 1u);
    EXPECT_EQ(GetActiveObject(CLSID_Here, found.Receive()), MK_E_UNAVAILABLE);

    EXPECT_EQ(RegisterActiveObject(nullptr, CLSID_Here, &registration), E_INVALIDARG);
    EXPECT_EQ(RegisterActiveObject(object.Get(), CLSID_Here, nullptr), E_POINTER);
    EXPECT_EQ(GetActiveObject(CLSID_Here, nullptr), E_POINTER);
}

TEST(RunningObjectTable, FurtherSourcesAreAskedAfterThisProcess) {
    auto remote = MakeComObject<RecordingSink>(DIID_Unused);
    auto local = MakeComObject<RecordingSink>(DIID_Unused);
    auto source = std::make_shared<FakeSource>(static_cast<IDispatch*>(remote.Get()));
    const DWORD number = AddRunningObjectSource(source);
    ASSERT_NE(number, 0u);

    CComPtr<IUnknown> found;
    ASSERT_EQ(GetActiveObject(CLSID_Elsewhere, found.Receive()), S_OK);
    EXPECT_EQ(found.Get(), static_cast<IUnknown*>(static_cast<IDispatch*>(remote.Get())));
    EXPECT_EQ(GetActiveObject(CLSID_Here, found.Receive()), MK_E_UNAVAILABLE);

    // A registration in this process wins without asking the other sources.
    DWORD registration = 0;
    ASSERT_EQ(RegisterActiveObject(local.Get(), CLSID_Elsewhere, &registration), S_OK);
    const int askedBefore = source->asked;
    ASSERT_EQ(GetActiveObject(CLSID_Elsewhere, found.Receive()), S_OK);
    EXPECT_EQ(found.Get(), static_cast<IUnknown*>(static_cast<IDispatch*>(local.Get())));
    EXPECT_EQ(source->asked, askedBefore);
    RevokeActiveObject(registration);

    RemoveRunningObjectSource(number);
    EXPECT_EQ(GetActiveObject(CLSID_Elsewhere, found.Receive()), MK_E_UNAVAILABLE);
    source.reset();
    EXPECT_EQ(remote->RefCount(), 1u);
    EXPECT_EQ(AddRunningObjectSource(nullptr), 0u);
}
