"""A client of the robot's services for Python scripts: zefoko.Client.

The services of every process linked with a listening `zefoko serve --listen` process are
reached by name: call and post their methods, hear their signals and the memory events,
publish services of the script's own. The protocol is docs/protocol.md; the values travel
in MessagePack (python3-msgpack), the messages over ZeroMQ (python3-zmq).
"""

from .client import Client, RemoteError, LinkError, Service, NONE

__all__ = ["Client", "RemoteError", "LinkError", "Service", "NONE"]
