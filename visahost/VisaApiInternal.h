// What the VISA C library's source files share: the runtime's entry and the answer of an
// operation these resources do not offer.
#ifndef LBVISAHOST_VISAAPIINTERNAL_H
#define LBVISAHOST_VISAAPIINTERNAL_H

#include "visahost/Services.h"

namespace LbVisaHost {

inline const LbVisaHostApi& api()
{
    static const LbVisaHostApi* s_psApi = lbVisaHostApi();
    return *s_psApi;
}

// VI_ERROR_NSUP_OPER for an object of the runtime, VI_ERROR_INV_OBJECT for anything else.
inline ViStatus unsupported(ViObject nVi)
{
    ViAccessMode nState = 0;
    return api().getAttribute(nVi, VI_ATTR_RSRC_LOCK_STATE, &nState) == VI_ERROR_INV_OBJECT ? VI_ERROR_INV_OBJECT
                                                                                            : VI_ERROR_NSUP_OPER;
}

} // namespace LbVisaHost

#endif
