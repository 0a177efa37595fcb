'''A notification server that takes every call and never answers in time.'''

import time  # noqa: F401 (used by the method code below)

BUS_NAME = 'org.freedesktop.Notifications'
MAIN_OBJ = '/org/freedesktop/Notifications'
MAIN_IFACE = 'org.freedesktop.Notifications'
SYSTEM_BUS = False


def load(mock, parameters):
    mock.AddMethods(MAIN_IFACE, [
        ('GetCapabilities', '', 'as', 'time.sleep(60)\nret = []'),
        ('Notify', 'susssasa{sv}i', 'u', 'time.sleep(60)\nret = 1'),
    ])
