#pragma once
// The pause between two start attempts: 1 s, doubling up to 30 s.

class CBackoff {
public:
    static constexpr int kFirstMs = 1000;
    static constexpr int kLongestMs = 30000;

    // The pause before the next attempt; each call doubles the following one.
    int NextPauseMs();
    // After a successful start the next failure begins with the first pause again.
    void Reset() { m_nNextMs = kFirstMs; }

private:
    int m_nNextMs = kFirstMs;
};
