"""Reads an object of the network whole through the C interface: stream.py LIBRARY URL"""

import ctypes
import sys

BLOCK_SIZE = 65536


def load(path):
    library = ctypes.CDLL(path)
    library.OpenStream.argtypes = [ctypes.c_char_p, ctypes.POINTER(ctypes.c_void_p)]
    library.ReadBytes.argtypes = [ctypes.c_void_p, ctypes.c_void_p, ctypes.c_int32, ctypes.c_int32]
    library.ReadBytes.restype = ctypes.c_int32
    library.StreamContentLength.argtypes = [ctypes.c_void_p]
    library.StreamContentLength.restype = ctypes.c_uint64
    library.CloseStream.argtypes = [ctypes.c_void_p]
    library.CloseStream.restype = None
    return library


def read_whole(library, stream):
    block = ctypes.create_string_buffer(BLOCK_SIZE)
    content = bytearray()
    while True:
        count = library.ReadBytes(stream, block, 0, BLOCK_SIZE)
        content += block.raw[:count]
        if count < BLOCK_SIZE:
            return bytes(content)


def main(path, url):
    library = load(path)
    stream = ctypes.c_void_p()
    if library.OpenStream(url.encode(), ctypes.byref(stream)) != 0:
        sys.exit(1)
    length = library.StreamContentLength(stream)
    content = read_whole(library, stream)
    library.CloseStream(stream)
    print(f"{len(content)} of {length} bytes")
    sys.exit(0 if len(content) == length else 1)


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit(__doc__)
    main(*sys.argv[1:])
