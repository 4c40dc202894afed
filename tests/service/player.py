"""A template of python-dbusmock that plays any service.

Its parameters: "objects", a map from path to (interface, properties, methods); "delay", for how many
seconds every reading of properties takes; "error", the error that answers it; "endless", a folder
below which every path has an object with the property "Enabled"; "ignored", methods whose calls are
never answered; "silent", a folder below which no object answers for its properties.
"""

import os
import time

import dbus
import dbus.lowlevel

BUS_NAME = os.environ["PLAYED_NAME"]
MAIN_OBJ = "/com/kelv/Player"
MAIN_IFACE = "com.kelv.Player"
SYSTEM_BUS = True


def load(mock, parameters):
    for path, (interface, properties, methods) in parameters["objects"].items():
        mock.AddObject(path, interface, properties, [tuple(method) for method in methods])
    delay = parameters.get("delay", 0)
    endless = parameters.get("endless")
    error = parameters.get("error")
    ignored = parameters.get("ignored", [])
    silent = parameters.get("silent")

    def on_message(connection, message):
        if message.get_member() in ignored:
            return dbus.lowlevel.HANDLER_RESULT_HANDLED
        if message.get_member() != "GetAll":
            return dbus.lowlevel.HANDLER_RESULT_NOT_YET_HANDLED
        if silent and message.get_path().startswith(silent):
            return dbus.lowlevel.HANDLER_RESULT_HANDLED
        time.sleep(delay)
        if error:
            connection.send_message(dbus.lowlevel.ErrorMessage(message, error, "broken"))
            return dbus.lowlevel.HANDLER_RESULT_HANDLED
        if endless and message.get_path().startswith(endless + "/"):
            reply = dbus.lowlevel.MethodReturnMessage(message)
            reply.append({"Enabled": True}, signature="a{sv}")
            connection.send_message(reply)
            return dbus.lowlevel.HANDLER_RESULT_HANDLED
        return dbus.lowlevel.HANDLER_RESULT_NOT_YET_HANDLED

    mock.bus_name.get_bus().add_message_filter(on_message)
