#ifndef LBCORE_PARENT_H
#define LBCORE_PARENT_H
// CParent<T>: a checked, non-owning back pointer to the object that owns this one.
// getParent() never returns null: a missing parent is a programming error that must not be
// dereferenced, so it throws std::runtime_error("NULL pointer m_pcParent").
#include <stdexcept>

namespace LbCore {

template <class T> class CParent {
public:
    explicit CParent(T* parent) : m_pcParent(parent) { }
    virtual ~CParent() { }

    T* getParent() const
    {
        if (m_pcParent == nullptr) {
            throw std::runtime_error("NULL pointer m_pcParent");
        }
        return m_pcParent;
    }

protected:
    T* m_pcParent;
};

} // namespace LbCore

#endif
