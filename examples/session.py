"""Shows what the _Client3 module offers a script: its result codes and their messages.

A script drives the Pellux Post application through the module's flat functions; every operation
answers with a record whose `Result` is one of these codes.
"""
import _Client3

RESULT_CODES = (
    "Success",
    "UnknownStatus",
    "NotConnected",
    "RequestTimedOut",
    "ReplyParsingError",
    "ApplicationError",
    "InvalidFrameNumber",
    "ConversionError",
    "ExpectedOneFrame",
)


def main():
    functions = [name for name in vars(_Client3) if callable(getattr(_Client3, name))]
    print(f"_Client3: {len(functions)} functions")
    print("Result codes:")
    for name in RESULT_CODES:
        code = getattr(_Client3, name)
        print(f"  {code:5d}  {name:<20} {_Client3.ToString(code)}")


if __name__ == "__main__":
    main()
