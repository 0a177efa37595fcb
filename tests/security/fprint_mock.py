'''A scripted fingerprint service: parameter "readers" lists, per reader, the
    fingers "user" enrolled; anybody else has none.'''

import dbus  # noqa: F401 (the method code below raises its exceptions)

SYSTEM_BUS = True
BUS_NAME = 'net.reactivated.Fprint'
MAIN_OBJ = '/net/reactivated/Fprint/Manager'
MAIN_IFACE = 'net.reactivated.Fprint.Manager'
DEVICE_IFACE = 'net.reactivated.Fprint.Device'


def load(mock, parameters):
    readers = parameters.get('readers', [])
    user = parameters.get('user', '')
    paths = [f'/net/reactivated/Fprint/Device/{i}' for i in range(len(readers))]
    mock.AddMethods(MAIN_IFACE, [('GetDevices', '', 'ao', f'ret = {paths!r}')])
    for path, fingers in zip(paths, readers):
        mock.AddObject(path, DEVICE_IFACE, {}, [(
            'ListEnrolledFingers', 's', 'as',
            f'ret = {fingers!r} if args[0] == {user!r} else []\n'
            'if not ret: raise dbus.exceptions.DBusException(\n'
            '    "No prints", name="net.reactivated.Fprint.Error.NoEnrolledPrints")')])
