#!/usr/bin/python3
"""Calls the module Hello of a running zefoko serve: a greeting, then the robot's own
greeting (spoken by ZUMokuto with a wave), then the count of greetings.
Usage: hello.py [ENDPOINT [NAME]]

    zefoko serve --listen tcp://127.0.0.1:5555 /usr/lib/x86_64-linux-gnu/zefoko/libzumokuto.so build/hello/libhello.so &
    python3 examples/hello-module/hello.py tcp://127.0.0.1:5555 Ada
"""

import sys

import zefoko

endpoint = sys.argv[1] if len(sys.argv) > 1 else "tcp://127.0.0.1:5555"
name = sys.argv[2] if len(sys.argv) > 2 else "Ada"

with zefoko.Client(endpoint) as robot:
    hello = robot.service("Hello")
    print(hello.greet(name))
    hello.sayHello(name)
    print("greetings:", hello.greetings())
