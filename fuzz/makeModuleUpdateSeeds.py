#!/usr/bin/env python3
# Writes the end-to-end fuzzer's seeds (corpus/moduleUpdate) in the layout
# that updateInput.h describes. Run again after changing that layout.
import os
import struct

HERE = os.path.join(os.path.dirname(os.path.abspath(__file__)), "corpus", "moduleUpdate")
CLASS = "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}"
HEADER = "0143C000000000010002000302000A"
FAULTS = ["none", "stallRequest", "stallKind", "corruptRead", "unplugAtRequest", "failAllocation",
          "failRegistryQuery", "failFileRead", "failSizeQuery", "failSetPosition", "failDeviceTree", "refuseStream"]
SIGNATURE_A = bytes([0x30, 0xE4, 0x10, 0x75, 0x96, 0x11, 0x75, 0x97, 0x80, 0xE5, 0x96, 0x20, 0xE7, 0xFB, 0xE4, 0x90])
SIGNATURE_B = bytes([0x83, 0x02, 0x0C, 0x04, 0xE4, 0x93, 0xFC, 0x74, 0x01, 0x93, 0xFD, 0x74, 0x02, 0x93, 0xFE, 0x74])
FORMS = {None: 0, "text": 1, "textWithoutNul": 2, "expandText": 3, "binary": 4}


def identity(product=0x4B01, copy=0x4B01, vendor=0x5C1D, alt=0xFFFF, serial=0x0001E240, fill=0xFF):
    block = bytearray([fill] * 16)
    if fill == 0xFF:
        struct.pack_into(">H", block, 0, product)
        struct.pack_into(">H", block, 2, copy)
        struct.pack_into(">H", block, 8, vendor)
        struct.pack_into(">H", block, 10, alt)
        struct.pack_into(">I", block, 12, serial)
    return bytes(block)


def value(text, form="text"):
    if text is None:
        return bytes([0, 0])
    data = text.encode("latin-1")
    return bytes([FORMS[form], len(data)]) + data


def seed(name, loader=0x4A10, later=False, markerRoom=True, wideHeader=False, fault="none", argument=0, mask=0,
         length=1000, block=None, fvtpid=None, driver=CLASS + "\\0003", firmware="C:\\images\\fw.bin",
         systemRoot="C:\\WINDOWS", header=HEADER, pattern=b"", forms=None, signature=b"\xff" * 16):
    forms = forms or {}
    flags = (loader == 0x4A20) | (later << 1) | (markerRoom << 2) | (wideHeader << 3)
    data = bytes([flags, FAULTS.index(fault)]) + struct.pack("<HBH", argument, mask, length)
    data += block if block is not None else identity()
    data += signature
    data += value(fvtpid, forms.get("fvtpid", "text")) + value(driver, forms.get("driver", "text"))
    data += value(firmware, forms.get("firmware", "text")) + value(systemRoot, forms.get("systemRoot", "text"))
    data += bytes([len(header)]) + header.encode("latin-1") + pattern
    with open(os.path.join(HERE, name), "wb") as out:
        out.write(data)


os.makedirs(HERE, exist_ok=True)
seed("firmwareValue")
seed("defaultImage", driver=None, firmware=None, length=3000)
seed("largest4A10", driver=None, firmware=None, length=0x3400)
seed("largest4A20", loader=0x4A20, driver=None, firmware=None, length=0x7600, wideHeader=True)
seed("tooLong4A10", length=0x3401)
seed("blankIdentityFvtpid", block=identity(fill=0xFF, product=0xFFFF, copy=0xFFFF, vendor=0xFFFF, serial=0xFFFFFFFF),
     fvtpid="4B01", driver=None, firmware=None)
seed("erasedProductId", block=identity(product=0xFFFF, copy=0xFFFF, serial=0x00010000), driver=None, firmware=None)
seed("erasedProductIdSignatureA", block=identity(product=0xFFFF, copy=0xFFFF, serial=0x00010000), driver=None,
     firmware=None, signature=SIGNATURE_A)
seed("erasedProductIdSignatureB", block=identity(product=0xFFFF, copy=0x4B02, serial=0x00000001), driver=None,
     firmware=None, signature=SIGNATURE_B)
seed("zeroedIdentity", block=bytes(16), driver=None, firmware=None)
seed("pluggedInLater", later=True, loader=0x4A20)
seed("noMarkerRoom", markerRoom=False, pattern=b"\x12\x34")
seed("corruptRead", fault="corruptRead", argument=0x0400, mask=1)
seed("stallRequest", fault="stallRequest", argument=20)
seed("stallErase", fault="stallKind", argument=2)
seed("unplugMidway", fault="unplugAtRequest", argument=40)
seed("failAllocation", fault="failAllocation", argument=2)
seed("failDriverQuery", fault="failRegistryQuery", argument=1)
seed("failFileRead", fault="failFileRead", argument=2)
seed("failSizeQuery", fault="failSizeQuery")
seed("failSetPosition", fault="failSetPosition")
for which, name in enumerate(["CreateQuery", "SetAttribute", "FindDevices", "AddListener", "RemoveListener"]):
    seed("failTree" + name, fault="failDeviceTree", argument=which)
seed("refuseStream", fault="refuseStream", argument=0)
seed("refuseTransferBuffer", fault="refuseStream", argument=1)
seed("firmwareWithoutNul", firmware="C:\\images\\fw.bin", forms={"firmware": "textWithoutNul"})
seed("driverExpandText", forms={"driver": "expandText"})
seed("longFirmwarePath", firmware="C:\\" + "d\\" * 120 + "fw.bin")
seed("emptyImage", length=0, header="")
seed("shortHeader", header="0143C000", length=600)
