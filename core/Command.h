#ifndef LBCORE_COMMAND_H
#define LBCORE_COMMAND_H
// One-operation interfaces. CICommand<Signature, N> acts on something through execute();
// N only tells otherwise equal command interfaces apart. CISerializer<Argument, Result> writes
// an object into a target through serialize(), a constant operation.

namespace LbCore {

template <class Signature, int N> class CICommand;

template <class R, class... A, int N> class CICommand<R(A...), N> {
public:
    virtual ~CICommand() { }
    virtual R execute(A... arguments) = 0;
};

template <class Argument, class Result> class CISerializer {
public:
    virtual ~CISerializer() { }
    virtual Result serialize(Argument argument) const = 0;
};

} // namespace LbCore

#endif
