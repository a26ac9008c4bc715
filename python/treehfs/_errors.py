"""What goes wrong, as exceptions."""


class Error(Exception):
    """A call that failed: what it met in words, the name of the status, and its number.

    >>> try:
    ...     treehfs.open("nothing.img")
    ... except treehfs.Error as error:
    ...     print(error.name, error)
    cannot-open nothing.img: cannot open: no such file
    """

    def __init__(self, text: str, name: str, status: int) -> None:
        super().__init__(text)
        self.name = name
        self.status = status


class NotFound(Error, LookupError):
    """No such key, path, ID or field."""
