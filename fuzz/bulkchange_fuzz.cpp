// The runtime link's handling of "VariableBulkChange": the runtime stand-in
// (in this process, delivering on the calling thread) fires events whose
// arguments are built from the input: arrays of any element type, length and
// lower bound, numbers that are no ids, texts, by-reference values, too few
// arguments. What reaches the bridge must be exactly the elements that are
// whole and subscribed, in order, with their values, statuses and times,
// and what does not fit the queue must be reported, not dropped silently.

#include "runtime/BulkChangeArrays.h"
#include "runtime/MultipleOnlVarsPerPrj.h"

#include "tarvo/Control.h"

#include "FuzzCheck.h"

#include <QCoreApplication>

#include <cmath>
#include <deque>
#include <limits>
#include <map>
#include <optional>
#include <vector>

namespace {

// A value as the bridge sees it (and as the model expects it).
struct Value {
    VARTYPE vt = VT_EMPTY;
    double number = 0;  // numeric types
    std::u16string text;
};

struct Change {
    DWORD id;
    ULONGLONG status;
    double time;
    Value value;
    CVarItem** cell = nullptr;
};

bool SameNumber(double a, double b) { return a == b || (std::isnan(a) && std::isnan(b)); }

bool operator==(const Value& a, const Value& b) {
    return a.vt == b.vt && SameNumber(a.number, b.number) && a.text == b.text;
}

Value ValueOf(const VARIANT& v) {
    Value value;
    value.vt = v.vt;
    switch (v.vt) {
    case VT_R8: value.number = v.dblVal; break;
    case VT_I4: value.number = v.lVal; break;
    case VT_I2: value.number = v.iVal; break;
    case VT_UI8: value.number = static_cast<double>(v.ullVal); break;
    case VT_BOOL: value.number = v.boolVal; break;
    case VT_BSTR: value.text = v.bstrVal ? std::u16string(v.bstrVal, SysStringLen(v.bstrVal)) : std::u16string(); break;
    default: break;
    }
    return value;
}

class Recorder final : public IOnlVariablesPerProjectNotification {
public:
    void OnValueChange(const CString&, STarvoVarValue*& record) override {
        changes.push_back({record->dwId, record->qwStatus, record->dTime, ValueOf(record->vValue), record->ppHolder});
    }
    void OnProjectDeactivated(const CString&) override {}
    void OnProjectActivated(const CString&) override {}
    void OnProjectInactiveFailed(const CString&) override {}
    void OnProjectActiveFailed(const CString&) override {}
    void OnValueQueueFull(CString, DWORD id) override { queueFull.push_back(id); }
    void OnValuesDiscarded(const CString&, int) override {}

    std::vector<Change> changes;  // the runtime delivers on the calling thread: no lock needed
    std::vector<DWORD> queueFull;
};

// The stand-in runtime with three subscribed variables of project "Plant".
struct Link {
    Link() {
        tarvo::RuntimeConfig config;
        tarvo::ProjectConfig plant;
        plant.name = u"Plant";
        for (const char16_t* name : {u"Level", u"Flow", u"Mode", u"Other"}) {
            tarvo::VariableConfig variable;
            variable.name = name;
            plant.variables.push_back(variable);
        }
        config.projects = {plant};
        tarvo::RuntimeOptions options;
        options.delivery = tarvo::Delivery::CallerThread;
        options.simulate = false;
        runtime = new tarvo::Runtime(config, options);
        FuzzCheck(runtime->Start(), "the runtime starts");
        manager = VX_CreateCounted<CMultipleOnlVarsPerPrj>(&recorder, CString(), 2000);
        for (const char16_t* name : {u"Level", u"Flow", u"Mode"}) {
            auto* cell = new CVarItem*(nullptr);
            FuzzCheck(manager->AddVariable(CString(u"Plant#") + name, cell), "a variable is subscribed");
            cells[static_cast<DWORD>(*runtime->VariableId(u"Plant", name))] = cell;
        }
        FuzzCheck(manager->Start(), "the subscription starts");
        otherId = *runtime->VariableId(u"Plant", u"Other");
        manager->ProcessPending();
        queueLimit = manager->Projects().begin()->second->GetQueueLimit();
    }

    Recorder recorder;
    tarvo::Runtime* runtime;
    VX_KeepRefCmdPtr<CMultipleOnlVarsPerPrj> manager;
    std::map<DWORD, CVarItem**> cells;  // subscribed id -> its holder cell
    LONG otherId = 0;
    int queueLimit = 0;
};

Link& TheLink() {
    static int argc = 1;
    static char name[] = "bulkchange_fuzz";
    static char* argv[] = {name, nullptr};
    static QCoreApplication* app = new QCoreApplication(argc, argv);
    static Link* link = new Link;  // kept to the end: the runtime's threads outlive static destruction
    (void)app;
    return *link;
}

// Builds the event's arrays from the input and notes what the link can read of them.
class EventBuilder {
public:
    EventBuilder(FuzzBytes& in, const Link& link) : m_in(in) {
        for (const auto& [id, cell] : link.cells) m_ids.push_back(id);
        m_ids.push_back(static_cast<double>(link.otherId));
        m_ids.push_back(4294967296.0 + m_ids[0]);  // the low 32 bits name a subscribed id
    }

    // An array of numbers (or not an array at all); numbers[k] is element k as a number, if readable.
    CComVariant Numbers(std::vector<std::optional<double>>& numbers) {
        std::vector<std::optional<Value>> unused;
        return Array(numbers, unused);
    }
    // The values array; values[k] is element k as the bridge must get it, if readable.
    CComVariant Values(std::vector<std::optional<Value>>& values) {
        std::vector<std::optional<double>> unused;
        return Array(unused, values);
    }

private:
    CComVariant Array(std::vector<std::optional<double>>& numbers, std::vector<std::optional<Value>>& values);
    void PutElement(VARTYPE vt, void* slot, std::optional<double>& number, std::optional<Value>& value);
    void PutVariant(VARIANT* slot, std::optional<double>& number, std::optional<Value>& value);
    double Number();
    std::u16string Text();

    FuzzBytes& m_in;
    std::vector<double> m_ids;
    std::deque<CComVariant> m_pool;  // what by-reference elements point to
};

double EventBuilder::Number() {
    const std::uint8_t kind = m_in.Byte();
    switch (kind % 8) {
    case 0:
    case 1:
    case 2:
    case 3: return m_ids[(kind / 8) % m_ids.size()];
    case 4: return kind / 8;
    case 5: return m_in.Plain<double>();
    case 6: return kind & 8 ? std::nan("") : (kind & 16 ? 1e300 : -HUGE_VAL);
    default: return -static_cast<double>(m_in.Byte());
    }
}

std::u16string EventBuilder::Text() {
    std::u16string text;
    for (char c : m_in.Text(6)) {
        const auto b = static_cast<unsigned char>(c);
        text.push_back(b >= 0xF0 ? static_cast<char16_t>(0xD800 + b)
                                 : static_cast<char16_t>(b));  // lone surrogates too
    }
    return text;
}

// A whole number of type T from the next number; out-of-range numbers wrap.
template <typename T>
T Integral(double number) {
    if (!std::isfinite(number) || std::fabs(number) >= 9.2e18) return static_cast<T>(0);
    return static_cast<T>(static_cast<std::int64_t>(number));
}

void EventBuilder::PutElement(VARTYPE vt, void* slot, std::optional<double>& number, std::optional<Value>& value) {
    const double d = Number();
    auto plain = [&](auto typed, bool readable) {
        std::memcpy(slot, &typed, sizeof typed);
        if (!readable) return;
        number = static_cast<double>(typed);
        value = Value{VT_R8, *number, {}};
    };
    switch (vt) {
    case VT_R8:
    case VT_DATE: plain(d, true); break;
    case VT_R4: plain(static_cast<float>(d), true); break;
    case VT_I4:
    case VT_INT: plain(Integral<std::int32_t>(d), true); break;
    case VT_UI4:
    case VT_UINT: plain(Integral<std::uint32_t>(d), true); break;
    case VT_I8: plain(Integral<std::int64_t>(d), true); break;
    case VT_I2: plain(Integral<std::int16_t>(d), false); break;
    case VT_UI1: plain(Integral<std::uint8_t>(d), false); break;
    case VT_BSTR: {
        const std::u16string text = Text();
        const BSTR s = text.empty() && (m_in.Byte() & 1)
                           ? nullptr
                           : SysAllocStringLen(text.data(), static_cast<UINT>(text.size()));
        std::memcpy(slot, &s, sizeof s);
        value = Value{VT_BSTR, 0, text};
        break;
    }
    default: PutVariant(static_cast<VARIANT*>(slot), number, value); break;
    }
}

void EventBuilder::PutVariant(VARIANT* slot, std::optional<double>& number, std::optional<Value>& value) {
    CComVariant v;
    const std::uint8_t kind = m_in.Byte() % 11;
    switch (kind) {
    case 0: v = CComVariant(Number()); break;
    case 1: v = CComVariant(Integral<int>(Number())); break;
    case 2: v = CComVariant(std::u16string_view(Text())); break;
    case 3: break;  // empty
    case 4: v = CComVariant(m_in.Flag()); break;
    case 5:
        v.vt = VT_I2;
        v.iVal = Integral<std::int16_t>(Number());
        break;
    case 6:
        v.vt = VT_UI8;
        v.ullVal = Integral<std::uint64_t>(Number());
        break;
    case 7: {  // a variant by reference (the runtime passes its own memory)
        m_pool.emplace_back(Number());
        v.vt = VT_VARIANT | VT_BYREF;
        v.pvarVal = &m_pool.back();
        break;
    }
    case 8: {  // a number by reference
        m_pool.emplace_back(Number());
        v.vt = VT_R8 | VT_BYREF;
        v.pdblVal = &m_pool.back().dblVal;
        break;
    }
    case 9: {  // a text by reference
        m_pool.emplace_back(std::u16string_view(Text()));
        v.vt = VT_BSTR | VT_BYREF;
        v.pbstrVal = &m_pool.back().bstrVal;
        break;
    }
    default:
        v.vt = VT_VARIANT | VT_BYREF;
        v.pvarVal = nullptr;
        break;  // a null reference
    }
    VariantCopy(slot, &v);
    // What the link must read: numbers of numeric variants (also behind a
    // variant reference); the value itself, by-reference ones as values.
    const Value seen = kind == 7    ? ValueOf(*v.pvarVal)
                       : kind == 8  ? Value{VT_R8, *v.pdblVal, {}}
                       : kind == 9  ? ValueOf(m_pool.back())
                       : kind == 10 ? Value{}
                                    : ValueOf(v);
    if (kind == 0 || kind == 1 || kind == 5 || kind == 6 || kind == 7) number = seen.number;
    value = seen;
}

CComVariant EventBuilder::Array(std::vector<std::optional<double>>& numbers,
                                std::vector<std::optional<Value>>& values) {
    static constexpr VARTYPE kTypes[] = {VT_R8,  VT_VARIANT, VT_R8, VT_VARIANT, VT_R4,   VT_I4, VT_INT,
                                         VT_UI4, VT_UINT,    VT_I8, VT_DATE,    VT_BSTR, VT_I2, VT_UI1};
    const std::uint8_t shape = m_in.Byte();
    if (shape % 16 == 15) return shape & 16 ? CComVariant() : CComVariant(Number());  // not an array
    const VARTYPE vt = kTypes[shape % 16 % std::size(kTypes)];
    constexpr LONG kMax = std::numeric_limits<LONG>::max(), kMin = std::numeric_limits<LONG>::min();
    static constexpr LONG kBounds[] = {0, 1, -1, kMax, kMin, kMax - 3};
    const LONG lower = kBounds[(shape / 16) % std::size(kBounds)];
    const std::uint32_t count = m_in.Byte() % 20;
    SAFEARRAY* array = SafeArrayCreateVector(vt, lower, count);
    numbers.assign(count, std::nullopt);
    values.assign(count, std::nullopt);
    for (std::uint32_t k = 0; k < count; ++k)
        PutElement(vt, static_cast<char*>(array->pvData) + std::size_t{k} * array->cbElements, numbers[k], values[k]);
    CComVariant holder;
    holder.vt = VT_ARRAY | vt;
    holder.parray = array;
    if (shape / 16 < 12) return holder;
    // The array by reference: the runtime's own array, which the link must not keep.
    m_pool.push_back(std::move(holder));
    CComVariant reference;
    reference.vt = VT_ARRAY | VT_BYREF | vt;
    reference.pparray = &m_pool.back().parray;
    return reference;
}

bool Low32(const std::optional<double>& number, DWORD* low) { return number && TruncatedLow32(*number, low); }

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Link& link = TheLink();
    FuzzBytes in(data, size);
    EventBuilder builder(in, link);

    const std::uint8_t layout = in.Byte();
    std::vector<std::optional<double>> ids, lows, highs, times;
    std::vector<std::optional<Value>> values;
    std::vector<CComVariant> args = {CComVariant(static_cast<int>(in.Byte()))};
    args.push_back(builder.Numbers(ids));
    args.push_back(builder.Values(values));
    args.push_back(builder.Numbers(lows));
    args.push_back(builder.Numbers(highs));
    args.push_back(builder.Numbers(times));
    if (layout % 8 == 0) args.resize(in.Byte() % args.size());  // too few arguments
    else if (layout % 8 == 1) args.emplace_back(1.0);           // one too many
    const bool whole = args.size() >= 6;

    // The model: each element present in all five arrays and readable, whose id is subscribed.
    std::vector<Change> expected;
    const std::size_t n = whole ? std::min({ids.size(), values.size(), lows.size(), highs.size(), times.size()}) : 0;
    for (std::size_t k = 0; k < n; ++k) {
        DWORD id = 0, low = 0, high = 0;
        if (!values[k] || !lows[k] || !highs[k] || !times[k] || !Low32(ids[k], &id) || !link.cells.count(id)) continue;
        Low32(lows[k], &low);
        Low32(highs[k], &high);
        expected.push_back({id, ULONGLONG{high} << 32 | low, *times[k], *values[k], link.cells.at(id)});
    }

    Recorder& got = link.recorder;
    got.changes.clear();
    got.queueFull.clear();
    FuzzCheck(link.runtime->FireRawBulkChange(u"Plant", u"", args, layout & 16), "the event is fired");
    link.manager->ProcessPending();

    FuzzCheck(got.changes.size() + got.queueFull.size() == expected.size(),
              "every whole subscribed element is delivered or reported");
    FuzzCheck(got.changes.size() >= std::min<std::size_t>(expected.size(), static_cast<std::size_t>(link.queueLimit)),
              "the queue takes at least its limit");
    for (std::size_t i = 0; i < got.changes.size(); ++i) {
        const Change& g = got.changes[i];
        const Change& e = expected[i];
        FuzzCheck(g.id == e.id && g.cell == e.cell, "changes arrive in order with their holder cell");
        FuzzCheck(g.status == e.status, "a change keeps its status");
        FuzzCheck(SameNumber(g.time, e.time), "a change keeps its time");
        FuzzCheck(g.value == e.value, "a change keeps its value");
    }
    for (std::size_t i = 0; i < got.queueFull.size(); ++i)
        FuzzCheck(got.queueFull[i] == expected[got.changes.size() + i].id, "a change that does not fit is reported");
    return 0;
}
