'''A scripted file manager: ShowItems answers at once (or, with "silent",
after far longer than any caller waits).'''

import time  # noqa: F401 (used by the method code below)

BUS_NAME = 'org.freedesktop.FileManager1'
MAIN_OBJ = '/org/freedesktop/FileManager1'
MAIN_IFACE = 'org.freedesktop.FileManager1'
SYSTEM_BUS = False


def load(mock, parameters):
    delay = 'time.sleep(60)\n' if parameters.get('silent') else ''
    mock.AddMethods(MAIN_IFACE, [
        ('ShowItems', 'ass', '', delay + 'pass'),
        ('ShowFolders', 'ass', '', 'pass'),
    ])
