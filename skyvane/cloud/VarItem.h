#pragma once
// One exported variable: its key and the last value, status and time stamp
// the runtime reported for it, with the change detection that decides what
// is exported.

#include "automation/variant.h"
#include "platform/object.h"
#include "platform/sync.h"
#include "platform/text.h"

#include <memory>

// What the runtime last reported for a variable: a plain value, copied whole.
struct SVarItemValue {
    CString m_strValue;     // the value of a text variable, else empty
    double m_dValue = 0.0;  // the value of any other variable, 0.0 for text
    DWORD m_dwStatusLow = 0;
    DWORD m_dwStatusHigh = 0;
    bool m_bIsString = false;
    bool m_bValid = false;     // a value has been stored at least once
    LONGLONG m_time = 0;       // seconds since 1970-01-01 00:00 UTC
    WORD m_wMilliseconds = 0;  // 0 to 999, not folded into m_time

    bool operator==(const SVarItemValue& other) const = default;
};

class CVarItemRtData : public CObject, public SVarItemValue {
public:
    CVarItemRtData() = default;
    // The value is copied, the lock is not (each object has its own); neither
    // takes the source's lock.
    CVarItemRtData(const CVarItemRtData& other) : CObject(), SVarItemValue(other) {}
    CVarItemRtData& operator=(const CVarItemRtData& other) {
        SVarItemValue::operator=(other);
        return *this;
    }
    ~CVarItemRtData() override = default;

    // Stores a reported value when it is a change: other text (letter case
    // counts), a number outside the band of +-max(1, |stored|) * 2^-52 around
    // the stored one (NaN is always outside), another status word, or the
    // item's first value. The time stamp takes no part in the decision.
    // True when the change was stored completely; false for no change, for a
    // value that is no number, and for a time stamp that cannot be stored.
    bool Update(const VARIANT* value, DWORD statusLow, DWORD statusHigh, const DATE* time);

    // Text values (VT_BSTR, also by reference) give their text and 0.0;
    // everything else a number and an empty text, or false when it is none.
    static bool ConvertValue(const VARIANT* value, CString& text, double& number, bool& isText);

    // Stores value, status, flags and time together: a DATE before 1900
    // stores time 0; otherwise the local calendar time (daylight saving as
    // the system decides for that date) must lie from 1970-01-01 00:00:00 to
    // 3000-12-31 23:59:59 UTC. A time stamp outside that, or none at all,
    // stores nothing and gives false.
    bool SetValue(const CString& text, double number, bool isText, DWORD statusLow, DWORD statusHigh, const DATE* time);

    CCriticalSection m_cs;  // guards every field of the value
};

class CVarItem : public CObject {
public:
    CVarItem() : m_pRtData(std::make_unique<CVarItemRtData>()) {}
    // Same key, a separate copy of the runtime data.
    CVarItem(const CVarItem& other)
        : m_pRtData(std::make_unique<CVarItemRtData>(*other.m_pRtData)), m_strName(other.m_strName) {}
    CVarItem& operator=(const CVarItem&) = delete;
    ~CVarItem() override = default;

    // Splits a variable key at its first "#" into project and variable name;
    // a key without "#" has an empty project.
    static void SplitKey(const CString& key, CString& project, CString& variable);

    const std::unique_ptr<CVarItemRtData> m_pRtData;  // never null
    CString m_strName;                                // the variable key: project "#" variable
};
