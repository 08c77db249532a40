#ifndef LBCORE_SUBJECT_H
#define LBCORE_SUBJECT_H
// CSubjectBase<T> / CSubject<T, R (A)>: a thread-safe observer list. Observers are not owned,
// kept in attachment order without duplicates. notify() calls one member operation on every
// observer, in order, under the subject's recursive lock, and stops before the next observer
// once disable() has cleared the notification flag (it is never set again). An observer must
// not attach to or detach from the subject that is calling it.
#include "core/Lock.h"

#include <algorithm>
#include <atomic>
#include <type_traits>
#include <vector>

namespace LbCore {

template <class T> class CSubjectBase {
public:
    CSubjectBase() : m_bNotify(true) { }
    virtual ~CSubjectBase()
    {
        CLock<CCriticalSection> lock(m_cLock);
        m_cObservers.clear();
    }

    bool attach(T& observer)
    {
        CLock<CCriticalSection> lock(m_cLock);
        if (std::find(m_cObservers.begin(), m_cObservers.end(), &observer) != m_cObservers.end()) {
            return false;
        }
        m_cObservers.push_back(&observer);
        return true;
    }

    bool detach(T& observer)
    {
        CLock<CCriticalSection> lock(m_cLock);
        typename std::vector<T*>::iterator end = std::remove(m_cObservers.begin(), m_cObservers.end(), &observer);
        if (end == m_cObservers.end()) {
            return false;
        }
        m_cObservers.erase(end, m_cObservers.end());
        return true;
    }

    // Lock-free on purpose: a walk in progress on another thread stops at its next observer.
    void disable() { m_bNotify = false; }
    bool isEnabled() const { return m_bNotify; }

protected:
    std::atomic<bool> m_bNotify;
    CCriticalSection m_cLock;
    std::vector<T*> m_cObservers GUARDED_BY(m_cLock);
};

template <class T, class Signature> class CSubject;

template <class T, class R, class A> class CSubject<T, R(A)> : public CSubjectBase<T> {
public:
    typedef R (T::*Member)(A);

    explicit CSubject(Member member, R defaultResult = R()) : m_pfMember(member), m_cDefault(defaultResult) { }

    R notify(A argument) { return notify(argument, m_pfMember); }

    R notify(A argument, Member member)
    {
        R result = m_cDefault;
        if (member == nullptr) {
            return result;
        }
        CLock<CCriticalSection> lock(this->m_cLock);
        for (std::size_t i = 0; i < this->m_cObservers.size() && this->m_bNotify; ++i) {
            R answer = (this->m_cObservers[i]->*member)(argument);
            if (answer != m_cDefault) {
                result = answer;
            }
        }
        return result;
    }

private:
    Member m_pfMember;
    R m_cDefault;
};

template <class T, class A> class CSubject<T, void(A)> : public CSubjectBase<T> {
public:
    typedef void (T::*Member)(A);

    explicit CSubject(Member member = nullptr) : m_pfMember(member) { }

    void notify(A argument) { notify(argument, m_pfMember); }

    void notify(A argument, Member member)
    {
        if (member == nullptr) {
            return;
        }
        CLock<CCriticalSection> lock(this->m_cLock);
        for (std::size_t i = 0; i < this->m_cObservers.size() && this->m_bNotify; ++i) {
            (this->m_cObservers[i]->*member)(argument);
        }
    }

private:
    Member m_pfMember;
};

} // namespace LbCore

#endif
