// File and asynchronous I/O of the VISA C library. viReadToFile reads with viRead until the end
// of a message or the count and writes what came to the file (appended when
// VI_ATTR_FILE_APPEND_EN is set); viWriteFromFile sends up to the count of the file's bytes
// with one viWrite. viReadAsync / viWriteAsync are the runtime's (see RuntimeAsync.cpp).
#include <algorithm>
#include <cstdio>
#include <memory>
#include <new>
#include <string>

#include "visahost/BufferedIo.h"
#include "visahost/VisaApiInternal.h"

using LbVisaHost::api;
using LbVisaHost::CSessionIo;

namespace {

// Largest single read of viReadToFile: passports may refuse a buffer smaller than a message.
const ViUInt32 g_nFileChunk = 1u << 24;

struct SFileCloser {
    void operator()(std::FILE* p) const { std::fclose(p); }
};
using PFile = std::unique_ptr<std::FILE, SFileCloser>;

// The file of a transfer on session vi: opened to be written (viReadToFile; appended when the
// session asks so) or read (viWriteFromFile). Null with nStatus when the session or the file
// is not there.
PFile openFile(ViSession vi, ViConstString filename, bool bToFile, ViStatus& nStatus)
{
    std::shared_ptr<CSessionIo> pc = CSessionIo::of(vi, nStatus);
    if (!pc)
        return nullptr;
    const char* szMode = !bToFile ? "rb" : pc->appendsToFiles() ? "ab" : "wb";
    PFile pFile(filename ? std::fopen(filename, szMode) : nullptr);
    if (!pFile)
        nStatus = VI_ERROR_FILE_ACCESS;
    return pFile;
}

} // namespace

extern "C" {

ViStatus _VI_FUNC viReadToFile(ViSession vi, ViConstString filename, ViUInt32 cnt, ViPUInt32 retCnt)
{
    if (retCnt)
        *retCnt = 0;
    ViStatus nStatus = VI_SUCCESS;
    PFile pFile = openFile(vi, filename, true, nStatus);
    if (!pFile)
        return nStatus;
    try {
        std::string strChunk(std::min(cnt, g_nFileChunk), '\0');
        ViUInt32 nDone = 0;
        nStatus = VI_SUCCESS_MAX_CNT;
        while (nDone < cnt && nStatus == VI_SUCCESS_MAX_CNT) {
            ViUInt32 nRet = 0;
            ViUInt32 nAsk = std::min<ViUInt32>(cnt - nDone, static_cast<ViUInt32>(strChunk.size()));
            nStatus = api().read(vi, reinterpret_cast<ViPBuf>(&strChunk[0]), nAsk, &nRet);
            if (nStatus < VI_SUCCESS)
                break;
            if (std::fwrite(strChunk.data(), 1, nRet, pFile.get()) != nRet)
                return VI_ERROR_FILE_IO;
            nDone += nRet;
            if (retCnt)
                *retCnt = nDone;
            if (nRet == 0)
                break;
        }
        if (std::fflush(pFile.get()) != 0)
            return VI_ERROR_FILE_IO;
        return nStatus;
    } catch (const std::bad_alloc&) {
        return VI_ERROR_ALLOC;
    }
}

ViStatus _VI_FUNC viWriteFromFile(ViSession vi, ViConstString filename, ViUInt32 cnt, ViPUInt32 retCnt)
{
    if (retCnt)
        *retCnt = 0;
    ViStatus nStatus = VI_SUCCESS;
    PFile pFile = openFile(vi, filename, false, nStatus);
    if (!pFile)
        return nStatus;
    try {
        std::string strData;
        char acBlock[4096];
        while (strData.size() < cnt) {
            size_t nAsk = std::min<size_t>(sizeof acBlock, cnt - strData.size());
            size_t n = std::fread(acBlock, 1, nAsk, pFile.get());
            strData.append(acBlock, n);
            if (n < nAsk)
                break;
        }
        if (std::ferror(pFile.get()))
            return VI_ERROR_FILE_IO;
        return api().write(vi, reinterpret_cast<ViConstBuf>(strData.data()), static_cast<ViUInt32>(strData.size()),
                           retCnt);
    } catch (const std::bad_alloc&) {
        return VI_ERROR_ALLOC;
    }
}

ViStatus _VI_FUNC viReadAsync(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPJobId jobId)
{
    return api().readAsync(vi, buf, cnt, jobId);
}

ViStatus _VI_FUNC viWriteAsync(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPJobId jobId)
{
    return api().writeAsync(vi, buf, cnt, jobId);
}

} // extern "C"
