#!/usr/bin/env python3
"""Calls one function of the C interface: cinterface.py LIBRARY DATABASE NAME STUDY [UID | JOB]. Prints what it gave."""
import ctypes
import sys

TEXTS = ctypes.POINTER(ctypes.c_char_p)


def load(path, database):
    library = ctypes.CDLL(path)
    library.ConfigureLogging(ctypes.c_short(1), database.encode())
    for name, arguments in (("DeleteImagesInTagFile", [ctypes.c_char_p, ctypes.c_int, TEXTS]),
                            ("DeleteTagFile", [ctypes.c_char_p]),
                            ("UpdateTagFile", [ctypes.c_char_p, ctypes.c_char_p, ctypes.c_int, TEXTS, TEXTS])):
        getattr(library, name).argtypes = arguments
        getattr(library, name).restype = ctypes.c_bool
    library.ReadAndSyncTagFileData.argtypes = [ctypes.c_char_p, ctypes.c_char_p, ctypes.POINTER(ctypes.c_uint),
                                               ctypes.POINTER(ctypes.c_char_p)]
    library.ReadAndSyncTagFileData.restype = ctypes.c_void_p
    library.FreeTagFileData.argtypes = [ctypes.c_void_p]
    return library


def read(library, study):
    size, data = ctypes.c_uint(), ctypes.c_char_p()
    handle = library.ReadAndSyncTagFileData(study, None, ctypes.byref(size), ctypes.byref(data))
    library.FreeTagFileData(handle)
    return size.value


def main(path, database, name, study, *more):
    library = load(path, database)
    uids = (ctypes.c_char_p * 1)(more[0].encode()) if more else None
    if name == "ReadAndSyncTagFileData":
        result = read(library, study.encode())
    elif name == "UpdateTagFile":
        with open(more[1], "rb") as job:
            result = library.UpdateTagFile(job.read(), study.encode(), 1, uids, None)
    elif name == "DeleteTagFile":
        result = library.DeleteTagFile(study.encode())
    else:
        result = library.DeleteImagesInTagFile(study.encode(), 1, uids)
    print(int(result))


if __name__ == "__main__":
    main(*sys.argv[1:])
