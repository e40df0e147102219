"""A Python client of the qvd plug-in registry daemon (standard library only)."""

from . import cbor, constants, frame
from .cbor import CborError, Date
from .client import Client, ProtocolError, QVDError, file_url, socket_path

__all__ = ["Client", "QVDError", "ProtocolError", "CborError", "Date", "cbor", "constants",
           "frame", "file_url", "socket_path"]
