/* Fundamental VISA data types, as defined by the VISA standard for 64-bit environments. */
#ifndef LB_VISATYPE_H
#define LB_VISATYPE_H

#if defined(_WIN32)
#define _VI_FUNC __stdcall
#define _VI_FUNCC __cdecl
#define _VI_FUNCH __stdcall
#else
#define _VI_FUNC
#define _VI_FUNCC
#define _VI_FUNCH
#endif
#define _VI_PTR *
#define _VI_ERROR (-2147483647L - 1)

typedef unsigned long long ViUInt64;
typedef signed long long ViInt64;
#if defined(_WIN32)
typedef unsigned long ViUInt32;
typedef signed long ViInt32;
#else
typedef unsigned int ViUInt32;
typedef signed int ViInt32;
#endif
typedef unsigned short ViUInt16;
typedef signed short ViInt16;
typedef unsigned char ViUInt8;
typedef signed char ViInt8;
typedef char ViChar;
typedef unsigned char ViByte;
typedef void* ViAddr;
typedef float ViReal32;
typedef double ViReal64;

typedef ViUInt64* ViPUInt64;
typedef ViInt64* ViPInt64;
typedef ViUInt32* ViPUInt32;
typedef ViInt32* ViPInt32;
typedef ViUInt16* ViPUInt16;
typedef ViInt16* ViPInt16;
typedef ViUInt8* ViPUInt8;
typedef ViInt8* ViPInt8;
typedef ViChar* ViPChar;
typedef ViByte* ViPByte;
typedef ViAddr* ViPAddr;
typedef ViReal32* ViPReal32;
typedef ViReal64* ViPReal64;

/* Arrays */
typedef ViUInt64* ViAUInt64;
typedef ViInt64* ViAInt64;
typedef ViUInt32* ViAUInt32;
typedef ViInt32* ViAInt32;
typedef ViUInt16* ViAUInt16;
typedef ViInt16* ViAInt16;
typedef ViUInt8* ViAUInt8;
typedef ViInt8* ViAInt8;
typedef ViChar* ViAChar;
typedef ViByte* ViAByte;
typedef ViAddr* ViAAddr;
typedef ViReal32* ViAReal32;
typedef ViReal64* ViAReal64;

typedef ViUInt16 ViBoolean;
typedef ViBoolean* ViPBoolean;
typedef ViBoolean* ViABoolean;
typedef ViPChar ViString;
typedef const ViChar* ViConstString;
typedef ViString* ViPString;
typedef ViString ViRsrc;
typedef ViRsrc* ViPRsrc;
typedef ViConstString ViConstRsrc;
typedef ViPByte ViBuf;
typedef ViPByte ViPBuf;
typedef const ViByte* ViConstBuf;
typedef ViInt32 ViStatus;
typedef ViStatus* ViPStatus;
typedef ViStatus* ViAStatus;
typedef ViUInt32 ViVersion;
typedef ViVersion* ViPVersion;
typedef ViUInt32 ViObject;
typedef ViObject* ViPObject;
typedef ViObject ViSession;
typedef ViSession* ViPSession;
typedef ViUInt32 ViAttr;
typedef ViString ViKeyId;
typedef ViConstString ViConstKeyId;
typedef ViPChar ViPKeyId;

typedef ViUInt64 ViBusAddress;
typedef ViUInt64 ViBusSize;
typedef ViUInt64 ViAttrState;
typedef ViBusAddress* ViPBusAddress;
typedef ViBusSize* ViPBusSize;

#define VI_NULL 0
#define VI_TRUE 1
#define VI_FALSE 0

#endif
