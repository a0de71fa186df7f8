#!/usr/bin/env python3
"""Generates the starter animation library of the simulated robot.

Writes share/zefoko/behaviors/animations/<family>/{Gestures,BodyTalk}/<name>/behavior.json
for the posture families Stand, Sit and SitOnPod. Each behaviour is a set of joint
keyframes (absolute angles in radians) with Bezier handles computed from the neighbouring
keys. The output is deterministic: every behaviour draws from its own seeded generator.

Usage: tools/gen_animations.py [--output DIR]
"""

import argparse
import json
import pathlib
import random
import shutil

# The joints of the simulated body: (minimum, maximum, rest angle). Must agree with
# robotsim/src/jointmodel.cpp.
LEFT_ARM = {
    "LShoulderPitch": (-2.0, 2.0, 1.45),
    "LShoulderRoll": (-0.3, 1.3, 0.15),
    "LElbowYaw": (-2.0, 2.0, -1.2),
    "LElbowRoll": (-1.55, -0.03, -0.45),
    "LWristYaw": (-1.8, 1.8, 0.1),
    "LHand": (0.0, 1.0, 0.3),
}
MIRRORED = ("Roll", "Yaw")


def mirror_name(name):
    return ("R" if name[0] == "L" else "L") + name[1:]


def mirror_angle(name, angle):
    return -angle if name.endswith(MIRRORED) else angle


def make_joints():
    joints = {"HeadYaw": (-2.0, 2.0, 0.0), "HeadPitch": (-0.65, 0.5, 0.0)}
    joints.update(LEFT_ARM)
    for name, (low, high, rest) in LEFT_ARM.items():
        if name.endswith(MIRRORED):
            joints[mirror_name(name)] = (-high, -low, -rest)
        else:
            joints[mirror_name(name)] = (low, high, rest)
    return joints


JOINTS = make_joints()
JOINT_ORDER = list(JOINTS)
# Keys stay this far inside the limits.
MARGIN = 0.02

# The rest pose of each posture family, as changes to the standing rest pose. Seated, the
# forearms lie on the thighs; on a pod they are a little higher.
FAMILY_REST = {
    "Stand": {},
    "Sit": {"LShoulderPitch": 0.9, "LElbowRoll": -1.0, "LElbowYaw": -0.6, "LShoulderRoll": 0.1},
    "SitOnPod": {"LShoulderPitch": 1.05, "LElbowRoll": -0.85, "LElbowYaw": -0.8},
}
# Seated, big arm moves are kept smaller.
FAMILY_SCALE = {"Stand": 1.0, "Sit": 0.8, "SitOnPod": 0.85}


def rest_pose(family):
    pose = {name: rest for name, (_, _, rest) in JOINTS.items()}
    for name, angle in FAMILY_REST[family].items():
        pose[name] = angle
        pose[mirror_name(name)] = mirror_angle(name, angle)
    return pose


def clamp(name, angle):
    low, high, _ = JOINTS[name]
    return min(max(angle, low + MARGIN), high - MARGIN)


class Gesture:
    """Keyframes under construction: poses at times, each pose a set of joint angles.

    A joint gets a key at each pose that names it, holds its last angle until the last pose,
    and ends back at rest; between keys it follows their Bezier curve.
    """

    def __init__(self, family, rng):
        self.family = family
        self.rng = rng
        self.rest = rest_pose(family)
        self.scale = FAMILY_SCALE[family]
        self.poses = []  # (time, {joint: angle})

    def jitter(self, amount):
        return self.rng.uniform(-amount, amount)

    def arm(self, side, **angles):
        """Angles of one arm by short names (ShoulderPitch=...), written for the left arm
        and mirrored for the right one. Arm moves away from rest shrink when seated."""
        out = {}
        for short, angle in angles.items():
            name = "L" + short
            rest = self.rest[name]
            if short != "Hand":
                angle = rest + (angle - rest) * self.scale
            if side == "R":
                name, angle = mirror_name(name), mirror_angle(name, angle)
            out[name] = angle
        return out

    def pose(self, time, *parts, **head):
        """Adds angles at a time; angles given again for the same time join that pose."""
        time = round(time, 3)
        angles = next((p for t, p in self.poses if t == time), None)
        if angles is None:
            angles = {}
            self.poses.append((time, angles))
            self.poses.sort(key=lambda pose: pose[0])
        for part in parts:
            angles.update(part)
        angles.update(head)

    def descriptor(self, tags):
        end = self.poses[-1][0] + self.rng.uniform(0.6, 0.8)
        joints = {}
        for name in JOINT_ORDER:
            times = [time for time, pose in self.poses if name in pose]
            angles = [round(clamp(name, pose[name]), 4) for _, pose in self.poses if name in pose]
            if not times:
                continue
            # The joint holds its last angle until the gesture ends, then goes back to rest.
            if times[-1] < self.poses[-1][0]:
                times.append(self.poses[-1][0])
                angles.append(angles[-1])
            times.append(round(end, 3))
            angles.append(round(clamp(name, self.rest[name]), 4))
            joints[name] = {"times": times, "keys": bezier_keys(times, angles)}
        return {"tags": tags, "duration": round(end, 3), "joints": joints}


def tidy(value):
    """Four decimals, and never a negative zero."""
    return round(value, 4) + 0.0


def bezier_keys(times, angles):
    """Keys [angle, before-handle, after-handle]. A handle reaches a third of the way to the
    neighbouring key in time; its angle follows the slope through the neighbours, flat at a
    turning point and at both ends, and never past the neighbouring key's angle, so the curve
    stays between its keys."""
    keys = []
    count = len(times)
    for i, (t, a) in enumerate(zip(times, angles)):
        previous_t = times[i - 1] if i > 0 else 0.0
        before_dt = -(t - previous_t) / 3.0
        after_dt = (times[i + 1] - t) / 3.0 if i + 1 < count else 0.0
        slope = 0.0
        if 0 < i < count - 1:
            rise_in, rise_out = a - angles[i - 1], angles[i + 1] - a
            if rise_in * rise_out > 0:
                slope = (angles[i + 1] - angles[i - 1]) / (times[i + 1] - times[i - 1])
        before_da = slope * before_dt
        after_da = slope * after_dt
        if i > 0:
            limit = abs(a - angles[i - 1])
            before_da = max(-limit, min(limit, before_da))
        if i + 1 < count:
            limit = abs(angles[i + 1] - a)
            after_da = max(-limit, min(limit, after_da))
        keys.append([a, [3, tidy(before_dt), tidy(before_da)], [3, tidy(after_dt), tidy(after_da)]])
    return keys


# ---- gestures ----------------------------------------------------------------------------


def wave(g, side):
    t = 0.45 + g.jitter(0.05)
    g.pose(t, g.arm(side, ShoulderPitch=-0.55, ShoulderRoll=0.3, ElbowYaw=-1.0, ElbowRoll=-1.1,
                    WristYaw=0.0, Hand=1.0), HeadPitch=-0.08, HeadYaw=0.12 if side == "L" else -0.12)
    for _ in range(3):
        t += 0.3 + g.jitter(0.03)
        g.pose(t, g.arm(side, ElbowRoll=-0.6 + g.jitter(0.05)))
        t += 0.3 + g.jitter(0.03)
        g.pose(t, g.arm(side, ElbowRoll=-1.2 + g.jitter(0.05)))


def hey_right(g):
    wave(g, "R")


def hey_left(g):
    wave(g, "L")


def hello_open(g):
    g.pose(0.5, g.arm("L", ShoulderPitch=0.6, ShoulderRoll=0.55, ElbowRoll=-0.3, Hand=1.0),
           g.arm("R", ShoulderPitch=0.6, ShoulderRoll=0.55, ElbowRoll=-0.3, Hand=1.0),
           HeadPitch=-0.1)
    g.pose(1.1 + g.jitter(0.05), HeadPitch=0.12)
    g.pose(1.6 + g.jitter(0.05), HeadPitch=-0.02)


def nod(g, count, depth):
    t = 0.0
    for _ in range(count):
        t += 0.3 + g.jitter(0.03)
        g.pose(t, HeadPitch=depth + g.jitter(0.03))
        t += 0.3 + g.jitter(0.03)
        g.pose(t, HeadPitch=-0.05 + g.jitter(0.02))


def yes_nod(g):
    nod(g, 2, 0.22)


def yes_beat(g):
    g.pose(0.4, g.arm("R", ShoulderPitch=0.7, ElbowRoll=-1.2, ElbowYaw=-0.8, Hand=0.0),
           HeadPitch=0.05)
    g.pose(0.8 + g.jitter(0.04), g.arm("R", ShoulderPitch=0.95, ElbowRoll=-0.9), HeadPitch=0.2)
    g.pose(1.2 + g.jitter(0.04), g.arm("R", ShoulderPitch=0.75, ElbowRoll=-1.25), HeadPitch=0.0)


def shake(g, count, width):
    t = 0.0
    for _ in range(count):
        t += 0.28 + g.jitter(0.03)
        g.pose(t, HeadYaw=width + g.jitter(0.03))
        t += 0.4 + g.jitter(0.03)
        g.pose(t, HeadYaw=-width + g.jitter(0.03))
    g.pose(t + 0.3, HeadYaw=0.0)


def no_shake(g):
    shake(g, 2, 0.3)


def no_hand(g):
    g.pose(0.4, g.arm("R", ShoulderPitch=0.6, ShoulderRoll=0.05, ElbowRoll=-0.7, ElbowYaw=-0.3,
                      WristYaw=-0.6, Hand=1.0), HeadYaw=0.2)
    g.pose(0.8 + g.jitter(0.04), g.arm("R", WristYaw=0.5), HeadYaw=-0.2)
    g.pose(1.2 + g.jitter(0.04), g.arm("R", WristYaw=-0.6), HeadYaw=0.15)
    g.pose(1.6 + g.jitter(0.04), g.arm("R", WristYaw=0.3), HeadYaw=0.0)


def me_chest(g):
    g.pose(0.5, g.arm("R", ShoulderPitch=0.85, ShoulderRoll=0.0, ElbowYaw=-1.5, ElbowRoll=-1.45,
                      WristYaw=-0.5, Hand=0.9), HeadPitch=0.1)
    g.pose(1.4 + g.jitter(0.1), g.arm("R", ElbowRoll=-1.5), HeadPitch=0.15)


def me_both(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.9, ShoulderRoll=0.0, ElbowYaw=-1.5,
                          ElbowRoll=-1.4, Hand=0.8))
    g.pose(0.5, HeadPitch=0.12)
    g.pose(1.5 + g.jitter(0.1), HeadPitch=0.05)


def point(g, side, hand):
    g.pose(0.5, g.arm(side, ShoulderPitch=0.25, ShoulderRoll=0.05, ElbowYaw=-0.8, ElbowRoll=-0.1,
                      WristYaw=0.0, Hand=hand), HeadPitch=-0.05)
    g.pose(1.3 + g.jitter(0.1), g.arm(side, ShoulderPitch=0.3 + g.jitter(0.05)))


def you_point(g):
    point(g, "R", 0.15)


def you_palm(g):
    point(g, "L", 1.0)


def count(g, opening):
    g.pose(0.45, g.arm("R", ShoulderPitch=0.2, ShoulderRoll=0.2, ElbowYaw=0.2, ElbowRoll=-1.0,
                       WristYaw=1.2, Hand=opening), HeadPitch=-0.05, HeadYaw=-0.1)
    g.pose(1.2 + g.jitter(0.05), g.arm("R", ShoulderPitch=0.1), HeadYaw=-0.05)
    g.pose(1.8 + g.jitter(0.05), g.arm("R", ShoulderPitch=0.2))


def two(g):
    count(g, 0.4)


def three(g):
    count(g, 0.6)


def four(g):
    count(g, 0.8)


def five(g):
    count(g, 1.0)


def pick(g):
    g.pose(0.6, g.arm("R", ShoulderPitch=0.85, ShoulderRoll=-0.1, ElbowYaw=-0.2, ElbowRoll=-0.15,
                      Hand=1.0), HeadPitch=0.3, HeadYaw=-0.1)
    g.pose(1.1 + g.jitter(0.05), g.arm("R", Hand=0.0))
    g.pose(1.8 + g.jitter(0.05), g.arm("R", ShoulderPitch=0.5, ElbowRoll=-1.2), HeadPitch=0.1)


def oppose(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.45, ShoulderRoll=0.1, ElbowYaw=-0.2,
                          ElbowRoll=-0.3, WristYaw=1.4, Hand=1.0))
    g.pose(0.5, HeadPitch=-0.12)
    t = 1.2 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderPitch=0.35, ElbowRoll=-0.1))


def yeah(g):
    for side in ("L", "R"):
        g.pose(0.45, g.arm(side, ShoulderPitch=-0.3, ShoulderRoll=0.35, ElbowYaw=-1.0,
                           ElbowRoll=-1.3, Hand=0.0))
    g.pose(0.45, HeadPitch=-0.2)
    up, down = 0.85 + g.jitter(0.04), 1.3 + g.jitter(0.04)
    for side in ("L", "R"):
        g.pose(up, g.arm(side, ShoulderPitch=-0.6))
        g.pose(down, g.arm(side, ShoulderPitch=-0.35))


def meditate(g):
    for side in ("L", "R"):
        g.pose(0.8, g.arm(side, ShoulderPitch=1.0, ShoulderRoll=0.0, ElbowYaw=-1.4,
                          ElbowRoll=-1.3, WristYaw=0.0, Hand=0.5))
    g.pose(0.8, HeadPitch=0.3)
    g.pose(2.5 + g.jitter(0.2), HeadPitch=0.35)


def we_all(g):
    """Both arms open wide, then gathered to the chest."""
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.55, ShoulderRoll=0.7, ElbowYaw=-0.6,
                          ElbowRoll=-0.4, WristYaw=0.8, Hand=1.0))
    g.pose(0.5, HeadPitch=-0.05)
    t = 1.2 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderPitch=0.85, ShoulderRoll=0.05, ElbowYaw=-1.4,
                        ElbowRoll=-1.3, WristYaw=-0.3, Hand=0.8))
    g.pose(t, HeadPitch=0.1)


def they_side(g):
    """An open hand towards someone at the side, the head turned there."""
    g.pose(0.5, g.arm("R", ShoulderPitch=0.55, ShoulderRoll=0.9, ElbowYaw=-0.5, ElbowRoll=-0.2,
                      WristYaw=1.0, Hand=1.0), HeadYaw=-0.35)
    g.pose(1.3 + g.jitter(0.05), g.arm("R", ShoulderRoll=0.8), HeadYaw=-0.25)


def big_wide(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.45, ShoulderRoll=0.95, ElbowYaw=-0.4,
                          ElbowRoll=-0.25, WristYaw=0.9, Hand=1.0))
    g.pose(0.5, HeadPitch=-0.12)
    t = 1.2 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=1.15))


def small_close(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.6, ShoulderRoll=-0.05, ElbowYaw=-0.7,
                          ElbowRoll=-1.1, WristYaw=1.2, Hand=0.5))
    g.pose(0.5, HeadPitch=0.15)
    t = 1.2 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=-0.2, ElbowRoll=-1.3, Hand=0.3))


def all_sweep(g):
    """One open hand sweeping from the middle out to the side."""
    g.pose(0.45, g.arm("R", ShoulderPitch=0.45, ShoulderRoll=-0.2, ElbowYaw=-0.3, ElbowRoll=-0.3,
                       WristYaw=0.0, Hand=1.0), HeadYaw=0.1)
    g.pose(1.2 + g.jitter(0.05), g.arm("R", ShoulderRoll=1.0), HeadYaw=-0.3)


def many_both(g):
    for side in ("L", "R"):
        g.pose(0.45, g.arm(side, ShoulderPitch=0.5, ShoulderRoll=0.0, ElbowYaw=-0.6,
                           ElbowRoll=-0.5, Hand=1.0))
    t = 1.2 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=0.9))
    g.pose(t, HeadPitch=-0.1)


def nothing_wipe(g):
    """Both hands, palms down, crossed and wiped apart; a small shake of the head."""
    for side in ("L", "R"):
        g.pose(0.45, g.arm(side, ShoulderPitch=0.65, ShoulderRoll=-0.15, ElbowYaw=-0.2,
                           ElbowRoll=-0.9, WristYaw=0.0, Hand=1.0))
    t = 1.1 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=0.9, ElbowRoll=-0.3))
    g.pose(0.6, HeadYaw=0.15)
    g.pose(1.0, HeadYaw=-0.15)
    g.pose(1.4, HeadYaw=0.0)


def explain_open(g):
    """Both palms up, the hands rising and falling in turn."""
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.65, ShoulderRoll=0.2, ElbowYaw=0.4,
                          ElbowRoll=-0.8, WristYaw=1.4, Hand=1.0))
    t = 1.0 + g.jitter(0.04)
    g.pose(t, g.arm("L", ShoulderPitch=0.5), g.arm("R", ShoulderPitch=0.75))
    t += 0.5 + g.jitter(0.04)
    g.pose(t, g.arm("L", ShoulderPitch=0.75), g.arm("R", ShoulderPitch=0.5))
    g.pose(t + 0.5, g.arm("L", ShoulderPitch=0.65), g.arm("R", ShoulderPitch=0.65))


def weigh(g):
    """Two options weighed on open palms."""
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.7, ShoulderRoll=0.35, ElbowYaw=0.3,
                          ElbowRoll=-0.9, WristYaw=1.5, Hand=1.0))
    t = 1.0 + g.jitter(0.04)
    g.pose(t, g.arm("L", ShoulderPitch=0.55), g.arm("R", ShoulderPitch=0.85), HeadYaw=0.15)
    g.pose(t + 0.5, g.arm("L", ShoulderPitch=0.85), g.arm("R", ShoulderPitch=0.55), HeadYaw=-0.15)


def shrug(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.9, ShoulderRoll=0.45, ElbowYaw=0.5,
                          ElbowRoll=-1.0, WristYaw=1.5, Hand=1.0))
    g.pose(0.5, HeadPitch=0.05, HeadYaw=0.15)
    t = 1.3 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=0.55))
    g.pose(t, HeadYaw=0.1)


def here_down(g):
    g.pose(0.5, g.arm("R", ShoulderPitch=0.95, ShoulderRoll=0.05, ElbowYaw=-0.6, ElbowRoll=-0.35,
                      WristYaw=0.0, Hand=0.2), HeadPitch=0.3)
    g.pose(1.1 + g.jitter(0.05), g.arm("R", ShoulderPitch=1.1))
    g.pose(1.5 + g.jitter(0.05), HeadPitch=0.2)


def far_point(g):
    g.pose(0.6, g.arm("R", ShoulderPitch=-0.05, ShoulderRoll=0.25, ElbowYaw=-0.9, ElbowRoll=-0.05,
                      WristYaw=0.0, Hand=0.3), HeadPitch=-0.2, HeadYaw=-0.2)
    g.pose(1.4 + g.jitter(0.05), g.arm("R", ShoulderPitch=0.0))


def thanks_bow(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.95, ShoulderRoll=-0.05, ElbowYaw=-1.3,
                          ElbowRoll=-1.25, WristYaw=0.0, Hand=0.9))
    g.pose(0.5, HeadPitch=0.0)
    g.pose(0.95 + g.jitter(0.04), HeadPitch=0.4)
    g.pose(1.6 + g.jitter(0.04), HeadPitch=0.05)


def love_chest(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=0.95, ShoulderRoll=-0.05, ElbowYaw=-1.6,
                          ElbowRoll=-1.5, Hand=1.0))
    g.pose(0.5, HeadPitch=0.1, HeadYaw=0.1)
    g.pose(1.6 + g.jitter(0.1), HeadPitch=0.05, HeadYaw=0.05)


def happy_up(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=-0.5, ShoulderRoll=0.45, ElbowYaw=-1.2,
                          ElbowRoll=-0.5, Hand=1.0))
    g.pose(0.5, HeadPitch=-0.2)
    for t, roll in ((1.0, 0.6), (1.5, 0.45)):
        for side in ("L", "R"):
            g.pose(t + g.jitter(0.03), g.arm(side, ShoulderRoll=roll))


def beckon(g):
    g.pose(0.45, g.arm("R", ShoulderPitch=0.5, ShoulderRoll=0.1, ElbowYaw=0.3, ElbowRoll=-0.4,
                       WristYaw=1.4, Hand=1.0))
    t = 0.45
    for _ in range(2):
        t += 0.35 + g.jitter(0.03)
        g.pose(t, g.arm("R", ElbowRoll=-1.2))
        t += 0.35 + g.jitter(0.03)
        g.pose(t, g.arm("R", ElbowRoll=-0.5))


def stop_palm(g):
    g.pose(0.4, g.arm("R", ShoulderPitch=0.15, ShoulderRoll=0.05, ElbowYaw=-1.5, ElbowRoll=-0.6,
                      WristYaw=-1.2, Hand=1.0), HeadPitch=-0.05)
    g.pose(1.3 + g.jitter(0.05), g.arm("R", ShoulderPitch=0.1))


def great_fists(g):
    for side in ("L", "R"):
        g.pose(0.45, g.arm(side, ShoulderPitch=0.5, ShoulderRoll=0.2, ElbowYaw=-0.8,
                           ElbowRoll=-1.3, Hand=0.0))
    for t, pitch in ((0.8, 0.3), (1.15, 0.55)):
        for side in ("L", "R"):
            g.pose(t + g.jitter(0.03), g.arm(side, ShoulderPitch=pitch))
    g.pose(0.8, HeadPitch=-0.1)


def together_clasp(g):
    for side in ("L", "R"):
        g.pose(0.45, g.arm(side, ShoulderPitch=0.6, ShoulderRoll=0.6, ElbowYaw=-0.8,
                           ElbowRoll=-0.6, Hand=1.0))
    t = 1.1 + g.jitter(0.05)
    for side in ("L", "R"):
        g.pose(t, g.arm(side, ShoulderRoll=-0.15, ElbowRoll=-1.1, Hand=0.6))


def look_brow(g):
    g.pose(0.55, g.arm("R", ShoulderPitch=-0.2, ShoulderRoll=0.1, ElbowYaw=-0.8, ElbowRoll=-1.45,
                       WristYaw=-1.0, Hand=1.0), HeadYaw=-0.3, HeadPitch=-0.1)
    g.pose(1.3 + g.jitter(0.05), HeadYaw=0.2)
    g.pose(1.9 + g.jitter(0.05), HeadYaw=-0.1)


def sorry_low(g):
    for side in ("L", "R"):
        g.pose(0.5, g.arm(side, ShoulderPitch=1.1, ShoulderRoll=-0.05, ElbowYaw=-1.0,
                          ElbowRoll=-0.9, Hand=0.5))
    g.pose(0.5, HeadPitch=0.35)
    g.pose(1.6 + g.jitter(0.1), HeadPitch=0.3)


# Tags of the gestures for what a word says, in the three languages of the linguistic
# databases: each tag is a base form that the analysis gives for a word ("moi" for
# "moi", "penser" for "pense"). The databases keep these base forms first. A word that
# another language spells alike with another meaning is no tag: French "content" is
# English "contents", "ensemble" a musical one, "minuscule" a lowercase letter, "super"
# the superuser (French "non" stays: the English database gives the prefix "non-" no
# base form).
ME = ["me", "i", "myself", "je", "moi", "私", "僕"]
YOU = ["you", "yourself", "tu", "toi", "vous", "あなた", "君"]
YES = ["yes", "oui", "はい", "うん"]
NO = ["no", "non", "いいえ"]
HELLO = ["hello", "hey", "hi", "bonjour", "salut", "coucou", "こんにちは", "やあ"]

GESTURES = [
    ("Hey_1", HELLO, hey_right),
    ("Hey_2", HELLO, hey_left),
    ("Hello_1", ["hello", "welcome", "bonjour", "bienvenue", "こんにちは", "ようこそ"], hello_open),
    ("Yes_1", YES, yes_nod),
    ("Yes_2", YES + ["yeah"], yes_beat),
    ("No_1", NO, no_shake),
    ("No_2", NO + ["oppose"], no_hand),
    ("Me_1", ME, me_chest),
    ("Me_2", ME, me_both),
    ("You_1", YOU, you_point),
    ("You_2", YOU, you_palm),
    ("Two_1", ["two"], two),
    ("Three_1", ["three"], three),
    ("Four_1", ["four"], four),
    ("Five_1", ["five", "hello"], five),
    ("Pick_1", ["pick"], pick),
    ("Pick_2", ["pick"], weigh),
    ("Oppose_1", ["oppose", "no"], oppose),
    ("Oppose_2", ["oppose"], nothing_wipe),
    ("Yeah_1", ["yeah"], yeah),
    ("Medidate_1", ["medidate"], meditate),
    ("We_1", ["we", "us", "ourselves", "nous", "我々"], we_all),
    ("They_1", ["they", "them", "eux", "彼ら", "彼", "彼女"], they_side),
    ("Bye_1", ["goodbye", "bye", "adieu", "さようなら", "バイバイ"], hey_right),
    ("Think_1", ["think", "wonder", "penser", "réfléchir", "croire", "考える", "思う"],
     lambda g: thinking(g)),
    ("Big_1", ["big", "large", "huge", "enormous", "grand", "gros", "énorme", "immense", "大きい",
               "大きな", "巨大"], big_wide),
    ("Small_1", ["small", "little", "tiny", "petit", "小さい", "小さな"], small_close),
    ("All_1", ["all", "everything", "everyone", "everybody", "tout", "全部", "全て", "すべて", "皆さん",
               "みんな", "皆"], all_sweep),
    ("Many_1", ["many", "lot", "beaucoup", "nombreux", "たくさん", "沢山", "多い"], many_both),
    ("Nothing_1", ["nothing", "none", "nobody", "rien", "aucun", "zéro", "ゼロ", "無い"],
     nothing_wipe),
    ("Explain_1", ["explain", "describe", "show", "expliquer", "décrire", "montrer", "説明",
                   "教える"], explain_open),
    ("Maybe_1", ["maybe", "perhaps", "why", "peut-être", "pourquoi", "多分", "たぶん", "なぜ",
                 "どうして"], shrug),
    ("Here_1", ["here", "ici", "ここ"], here_down),
    ("Far_1", ["far", "loin", "遠い"], far_point),
    ("Thanks_1", ["thank", "thanks", "merci", "remercier", "ありがとう", "感謝"], thanks_bow),
    ("Love_1", ["love", "adore", "aimer", "adorer", "好き", "愛", "大好き"], love_chest),
    ("Happy_1", ["happy", "glad", "heureux", "joyeux", "joie", "嬉しい", "楽しい", "幸せ"],
     happy_up),
    ("Come_1", ["come", "venir", "来る"], beckon),
    ("Stop_1", ["stop", "wait", "arrêter", "attendre", "止める", "待つ", "ストップ"], stop_palm),
    ("Great_1", ["great", "excellent", "wonderful", "amazing", "génial", "bravo", "すごい",
                 "素晴らしい"], great_fists),
    ("Together_1", ["together", "一緒"], together_clasp),
    ("Look_1", ["look", "see", "watch", "regarder", "voir", "見る"], look_brow),
    ("Sorry_1", ["sorry", "apologize", "désoler", "pardon", "excuser", "ごめん"], sorry_low),
]

# ---- body talk -----------------------------------------------------------------------------


def speaking(g):
    """Beats of one or both arms while speaking: the arms only, so that the head stays free
    for the head moves of the body talk."""
    sides = g.rng.choice([("L",), ("R",), ("L", "R")])
    t = 0.0
    for _ in range(g.rng.randint(2, 3)):
        t += g.rng.uniform(0.45, 0.8)
        for side in sides:
            g.pose(t, g.arm(side, ShoulderPitch=g.rng.uniform(0.5, 1.1),
                            ShoulderRoll=g.rng.uniform(0.05, 0.4),
                            ElbowYaw=g.rng.uniform(-1.6, -0.6),
                            ElbowRoll=g.rng.uniform(-1.3, -0.5),
                            WristYaw=g.rng.uniform(-0.6, 0.8),
                            Hand=g.rng.uniform(0.2, 0.9)))


def listening(g):
    """Small shifts of the arms while listening."""
    t = 0.0
    for _ in range(g.rng.randint(1, 2)):
        t += g.rng.uniform(0.8, 1.3)
        for side in ("L", "R"):
            g.pose(t, g.arm(side, ShoulderPitch=g.rest["LShoulderPitch"] + g.jitter(0.12),
                            ElbowRoll=g.rest["LElbowRoll"] + g.jitter(0.12),
                            Hand=g.rng.uniform(0.2, 0.45)))


def thinking(g):
    """A hand to the chin, the head turned away."""
    side = g.rng.choice(["L", "R"])
    yaw = 0.25 if side == "R" else -0.25
    g.pose(0.7, g.arm(side, ShoulderPitch=0.45, ShoulderRoll=0.05, ElbowYaw=-1.3,
                      ElbowRoll=-1.5, WristYaw=-1.0, Hand=0.3),
           HeadPitch=-0.15, HeadYaw=yaw + g.jitter(0.05))
    g.pose(1.8 + g.jitter(0.2), HeadPitch=-0.2, HeadYaw=yaw * 1.2)
    g.pose(2.6 + g.jitter(0.2), HeadPitch=-0.1)


BODY_TALK = (
    [("Speaking_%d" % i, [], speaking) for i in range(1, 11)]
    + [("Listening_%d" % i, [], listening) for i in range(1, 6)]
    + [("Thinking_%d" % i, ["thinking", "think"], thinking) for i in range(1, 4)]
)

FAMILIES = ["Stand", "Sit", "SitOnPod"]


def write_descriptor(path, descriptor):
    """One line per key keeps the files readable and their diffs small."""
    lines = ["{",
             '  "tags": %s,' % json.dumps(descriptor["tags"], ensure_ascii=False),
             '  "duration": %s,' % json.dumps(descriptor["duration"]),
             '  "joints": {']
    joints = list(descriptor["joints"].items())
    for j, (name, track) in enumerate(joints):
        lines.append('    %s: {' % json.dumps(name))
        lines.append('      "times": %s,' % json.dumps(track["times"]))
        lines.append('      "keys": [')
        keys = track["keys"]
        for k, key in enumerate(keys):
            lines.append("        %s%s" % (json.dumps(key), "," if k + 1 < len(keys) else ""))
        lines.append("      ]")
        lines.append("    }%s" % ("," if j + 1 < len(joints) else ""))
    lines.append("  }")
    lines.append("}")
    path.parent.mkdir(parents=True, exist_ok=True)
    path.write_text("\n".join(lines) + "\n", encoding="utf-8")


def check(name, descriptor):
    duration = descriptor["duration"]
    assert 1.0 <= duration <= 4.0, "%s lasts %s s" % (name, duration)
    for joint, track in descriptor["joints"].items():
        low, high, _ = JOINTS[joint]
        times = track["times"]
        assert times[0] > 0 and all(a < b for a, b in zip(times, times[1:])), name
        for key in track["keys"]:
            assert low <= key[0] <= high, "%s: %s at %s" % (name, joint, key[0])


def main():
    root = pathlib.Path(__file__).resolve().parent.parent
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--output", type=pathlib.Path,
                        default=root / "share" / "zefoko" / "behaviors")
    args = parser.parse_args()

    package = args.output / "animations"
    if package.exists():
        shutil.rmtree(package)
    count = 0
    for family in FAMILIES:
        for folder, table in (("Gestures", GESTURES), ("BodyTalk", BODY_TALK)):
            for name, tags, build in table:
                path = "animations/%s/%s/%s" % (family, folder, name)
                gesture = Gesture(family, random.Random(path))
                build(gesture)
                descriptor = gesture.descriptor(tags)
                check(path, descriptor)
                write_descriptor(args.output / path / "behavior.json", descriptor)
                count += 1
    print("%d behaviours written under %s" % (count, package))


if __name__ == "__main__":
    main()
