'''A scripted desktop portal: OpenURI and OpenFile answer a request handle.
OpenFile writes the path its descriptor names to parameter "record". With
"silent", both methods take far longer than any caller waits.'''

import os  # noqa: F401 (used by the method code below)
import time  # noqa: F401

BUS_NAME = 'org.freedesktop.portal.Desktop'
MAIN_OBJ = '/org/freedesktop/portal/desktop'
MAIN_IFACE = 'org.freedesktop.portal.OpenURI'
SYSTEM_BUS = False


def load(mock, parameters):
    record = parameters.get('record', '/dev/null')
    delay = 'time.sleep(60)\n' if parameters.get('silent') else ''
    handle = '/org/freedesktop/portal/desktop/request/1_1/kivi'
    mock.AddMethods(MAIN_IFACE, [
        ('OpenURI', 'ssa{sv}', 'o', delay + f'ret = {handle!r}'),
        ('OpenFile', 'sha{sv}', 'o', delay +
         'fd = args[1].take()\n'
         f'open({record!r}, "a").write(os.readlink("/proc/self/fd/%d" % fd) + "\\n")\n'
         'os.close(fd)\n'
         f'ret = {handle!r}'),
    ])
