# Python 3.6 code: annotations, f-strings and async functions.
import asyncio
from typing import List


class Fetcher:
    retries: int = 3

    async def fetch_all(self, urls: List[str]) -> List[bytes]:
        results = await asyncio.gather(*[self.fetch(u) for u in urls])
        return [r for r in results if r]

    async def fetch(self, host):
        reader, writer = await asyncio.open_connection(host, 80)
        writer.write(f"GET / HTTP/1.0\r\nHost: {host}\r\n\r\n".encode())
        return await reader.read()
