// Signs in with headless Chromium at a provider of its own, brings a file in, and has another page of the provider, which is on
// the same site, try the same with the session that the browser has.
//
// usage: node signin.mjs KDD FOLDER FILE      FOLDER receives what the server has to know
//
// Modules are looked for in KDD_NODE_MODULES, the browser in CHROMIUM.

import { spawn } from 'node:child_process';
import { createHash, generateKeyPairSync, randomBytes, sign } from 'node:crypto';
import { readFileSync, writeFileSync } from 'node:fs';
import { createServer } from 'node:http';
import { createRequire } from 'node:module';
import { join } from 'node:path';
import { createInterface } from 'node:readline';

const [, , kdd, folder, file] = process.argv;
const require = createRequire(`${process.env.KDD_NODE_MODULES}/`);
const puppeteer = require('puppeteer-core');

const faults = [];
const check = (holds, what) => holds || faults.push(what);

// The provider asks nobody for a password.
const keys = generateKeyPairSync('rsa', { modulusLength: 2048 });
const codes = new Map();
const text = (object) => Buffer.from(JSON.stringify(object)).toString('base64url');
let issuer = '';

function tokenFor(form) {
  const asked = codes.get(form.get('code'));
  codes.delete(form.get('code'));
  if (createHash('sha256').update(form.get('code_verifier')).digest('base64url') !== asked?.get('code_challenge')) return '';
  const now = Math.floor(Date.now() / 1000);
  const signed = `${text({ alg: 'RS256', kid: 'a' })}.${text({ iss: issuer, aud: 'page', sub: 'anna', scope: 'images', nonce: asked.get('nonce'), iat: now, exp: now + 600 })}`;
  return `${signed}.${sign('sha256', Buffer.from(signed), keys.privateKey).toString('base64url')}`;
}

async function answerOf(request) {
  const { pathname, searchParams } = new URL(request.url, issuer);
  if (pathname === '/.well-known/openid-configuration') return { issuer, authorization_endpoint: `${issuer}/authorise`, token_endpoint: `${issuer}/token` };
  if (pathname === '/keys') return { keys: [{ ...keys.publicKey.export({ format: 'jwk' }), kid: 'a', use: 'sig', alg: 'RS256' }] };
  if (pathname !== '/token') return { code: codes.set(String(codes.size), searchParams) && String(codes.size - 1), asked: searchParams };
  let body = '';
  for await (const part of request) body += part;
  return { id_token: tokenFor(new URLSearchParams(body)), token_type: 'Bearer' };
}

const provider = createServer(async (request, response) => {
  if (request.url === '/evil') return response.setHeader('Content-Type', 'text/html').end('<form method=post enctype=text/plain><input name=a value=b></form>');
  const { code, asked, ...told } = await answerOf(request);
  if (!asked) return response.setHeader('Content-Type', 'application/json').end(JSON.stringify(told));
  return response.writeHead(302, { Location: `${asked.get('redirect_uri')}?code=${code}&state=${asked.get('state')}` }).end();
});
await new Promise((done) => { provider.listen(0, '127.0.0.1', done); });
issuer = `http://127.0.0.1:${provider.address().port}`;

writeFileSync(join(folder, 'session.keys'), `${randomBytes(32).toString('hex')}\n`, { mode: 0o600 });
writeFileSync(join(folder, 'access.json'), JSON.stringify({
  tokens: { issuer, audience: 'page', keys: `${issuer}/keys`, rights: [{ claim: 'scope', value: 'images', gives: ['read', 'store'] }] },
  signIn: { client: 'page', sessionKeys: join(folder, 'session.keys') },
}));
const server = spawn(kdd, ['serve', '--listen', '127.0.0.1:0', '--stow', '--access', join(folder, 'access.json')], { stdio: ['ignore', 'pipe', 'inherit'] });
const said = await new Promise((done) => { createInterface(server.stdout).once('line', done); });
const root = said.split(' ').pop();

const browser = await puppeteer.launch({ executablePath: process.env.CHROMIUM ?? '/usr/bin/chromium', args: ['--no-sandbox', '--disable-gpu'] });
const page = await browser.newPage();
page.on('pageerror', (error) => faults.push(`script: ${error.message}`));
const wait = (what, condition) => page.waitForFunction(condition).catch(() => faults.push(`waited in vain: ${what}`));
const images = () => page.evaluate(async () => (await (await fetch('dicom-web/instances')).json().catch(() => [])).length);

async function forge() {
  const other = await browser.newPage();
  await other.goto(`${issuer}/evil`);
  const sent = await other.evaluate(async (target, base64) => {
    const bytes = Uint8Array.from(atob(base64), (one) => one.charCodeAt(0));
    const ways = ['application/dicom', 'text/plain'].flatMap((type) => ['cors', 'no-cors'].map((mode) => [type, mode]));
    for (const [type, mode] of ways) await fetch(target, { method: 'POST', mode, credentials: 'include', headers: { 'Content-Type': type }, body: bytes }).catch(() => null);
    return navigator.sendBeacon(target, new Blob([bytes], { type: 'text/plain' }));
  }, `${root}/dicom-web/studies`, readFileSync(file).toString('base64'));
  check(sent, 'the browser did not send what the other page wanted');
  const request = other.waitForRequest((one) => one.url().endsWith('/dicom-web/studies'));
  const [answer] = await Promise.all([other.waitForNavigation(), other.$eval('form', (form, target) => { form.action = target; form.submit(); }, `${root}/dicom-web/studies`)]);
  const cookie = (await browser.cookies()).find((one) => one.httpOnly);
  check(cookie?.sameSite === 'Lax', 'there is no session');
  check((await request).method() === 'POST' && answer.status() === 403, `a form of another page is answered by ${answer.status()}`);
  await other.close();
}

try {
  await page.goto(`${root}/`);
  await wait('the page', () => document.querySelector('.upload-link') && document.querySelector('.leave'));
  await forge();
  check(await images() === 0, 'a page of another origin stored something');
  await page.evaluate(() => { location.hash = '#/upload'; });
  await (await page.waitForSelector('#upload-files')).uploadFile(file);
  await wait('the upload', () => document.querySelector('.upload-line')?.textContent === 'Done. 1 object in the archive.');
  check(await images() === 1, 'what was brought in is not there');
  await page.evaluate(() => { location.hash = '#/'; });
  await wait('the study in the list', () => document.querySelectorAll('.study').length === 1);
  check((await browser.cookies()).every((one) => one.httpOnly), 'a script can read a cookie');
} catch (error) {
  faults.push(String(error));
}
await browser.close();
server.kill();
provider.close();
provider.closeAllConnections();
for (const fault of faults) console.error(fault);
console.log(`${faults.length} faults`);
process.exitCode = faults.length > 0 ? 1 : 0;
