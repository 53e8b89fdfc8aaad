// Common data types of the GlobalPlatform TEE Internal Core API 1.1.2 (sections 3.2, 4.1, 5.2, 6.2).
#ifndef TEE_API_TYPES_H_
#define TEE_API_TYPES_H_

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

typedef uint32_t TEE_Result;

/// A TA's or device's universally unique identifier. In memory the first three fields are in the processor's order.
typedef struct {
  uint32_t timeLow;
  uint16_t timeMid;
  uint16_t timeHiAndVersion;
  uint8_t clockSeqAndNode[8];
} TEE_UUID;

/// Who called: one of TEE_LOGIN_*, and the caller's UUID where that login type has one.
typedef struct {
  uint32_t login;
  TEE_UUID uuid;
} TEE_Identity;

/// One of the four parameters of a call; the parameter types tell which member holds.
typedef union {
  struct {
    void* buffer;
    uint32_t size;
  } memref;
  struct {
    uint32_t a, b;
  } value;
} TEE_Param;

typedef struct __TEE_TASessionHandle* TEE_TASessionHandle;
typedef struct __TEE_PropSetHandle* TEE_PropSetHandle;
typedef struct __TEE_ObjectHandle* TEE_ObjectHandle;
typedef struct __TEE_ObjectEnumHandle* TEE_ObjectEnumHandle;
typedef struct __TEE_OperationHandle* TEE_OperationHandle;

typedef uint32_t TEE_ObjectType;

/// One attribute of an object or parameter of an operation: a reference to bytes, or two numbers. Bit 29 of the
/// identifier (TEE_ATTR_FLAG_VALUE) tells which.
typedef struct {
  uint32_t attributeID;
  union {
    struct {
      void* buffer;
      uint32_t length;
    } ref;
    struct {
      uint32_t a, b;
    } value;
  } content;
} TEE_Attribute;

typedef struct {
  uint32_t objectType;
  uint32_t keySize;
  uint32_t maxKeySize;
  uint32_t objectUsage;
  uint32_t dataSize;
  uint32_t dataPosition;
  uint32_t handleFlags;
} TEE_ObjectInfo;

typedef enum { TEE_DATA_SEEK_SET = 0, TEE_DATA_SEEK_CUR = 1, TEE_DATA_SEEK_END = 2 } TEE_Whence;

typedef uint32_t TEE_OperationMode;

typedef struct {
  uint32_t algorithm;
  uint32_t operationClass;
  uint32_t mode;
  uint32_t digestLength;
  uint32_t maxKeySize;
  uint32_t keySize;
  uint32_t requiredKeyUsage;
  uint32_t handleState;
} TEE_OperationInfo;

/// A point in time, or a duration: seconds and milliseconds (0 to 999).
typedef struct {
  uint32_t seconds;
  uint32_t millis;
} TEE_Time;

#endif  // TEE_API_TYPES_H_
