#!/usr/bin/python3
"""Speaks a text through the service ZUMokuto of a running robot and prints the memory event
that ends it. Usage: examples/say.py ENDPOINT [TEXT]

    build/default/zefoko/zefoko serve --listen ipc:///tmp/robot &
    build/default/zefoko/zefoko serve --connect ipc:///tmp/robot build/default/mokuto/libzumokuto.so &
    python3 examples/say.py ipc:///tmp/robot "Hello ^start(animations/Stand/Gestures/Hey_1) there"
"""

import os
import sys
import threading

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "python"))

import zefoko  # noqa: E402

endpoint = sys.argv[1] if len(sys.argv) > 1 else "tcp://127.0.0.1:5555"
text = sys.argv[2] if len(sys.argv) > 2 else "Hello ^start(animations/Stand/Gestures/Hey_1) my friend."

with zefoko.Client(endpoint) as robot:
    ended = threading.Event()
    robot.subscribe_event("ZUMokuto/EndOfMokuto",
                          lambda key, value, message: (print(key, value), ended.set()))
    robot.service("ZUMokuto").say(text)
    if not ended.wait(10):
        sys.exit("no end event within 10 s")
