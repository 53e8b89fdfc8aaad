"""Reaches the TA through the Client API library, loaded at run time: plug_in.py LIBRARY TEE."""
import ctypes
import sys


class Uuid(ctypes.Structure):
    _fields_ = [("time_low", ctypes.c_uint32), ("time_mid", ctypes.c_uint16), ("time_hi_and_version", ctypes.c_uint16),
                ("clock_seq_and_node", ctypes.c_uint8 * 8)]


class TemporaryReference(ctypes.Structure):
    _fields_ = [("buffer", ctypes.c_void_p), ("size", ctypes.c_size_t)]


class RegisteredReference(ctypes.Structure):
    _fields_ = [("parent", ctypes.c_void_p), ("size", ctypes.c_size_t), ("offset", ctypes.c_size_t)]


class Value(ctypes.Structure):
    _fields_ = [("a", ctypes.c_uint32), ("b", ctypes.c_uint32)]


class Parameter(ctypes.Union):
    _fields_ = [("tmpref", TemporaryReference), ("memref", RegisteredReference), ("value", Value)]


class Operation(ctypes.Structure):
    _fields_ = [("started", ctypes.c_uint32), ("param_types", ctypes.c_uint32), ("params", Parameter * 4),
                ("imp", ctypes.c_void_p * 8)]


def succeed(result):
    if result & 0xFFFFFFFF:
        sys.exit(f"result 0x{result & 0xFFFFFFFF:08x}")


api = ctypes.CDLL(sys.argv[1])  # into a scope of its own, as plug-ins are
context, session, operation = ctypes.c_void_p(), ctypes.c_void_p(), Operation(param_types=0x0003)
keymaster_ta = Uuid(0xFBACEA43, 0xF475, 0x4DF3, (ctypes.c_uint8 * 8)(*bytes.fromhex("866f76256aba994f")))
succeed(api.TEEC_InitializeContext(sys.argv[2].encode(), ctypes.byref(context)))
succeed(api.TEEC_OpenSession(ctypes.byref(context), ctypes.byref(session), ctypes.byref(keymaster_ta), 0, None, None,
                             None))
succeed(api.TEEC_InvokeCommand(ctypes.byref(session), 1, ctypes.byref(operation), None))
print(f"the TA has {operation.params[0].value.a} algorithms")
api.TEEC_CloseSession(ctypes.byref(session))
api.TEEC_FinalizeContext(ctypes.byref(context))
